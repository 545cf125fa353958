// appsync-host plist lint|convert: checks and converts property-list files.
#include <algorithm>
#include <cstdio>
#include <string>
#include <vector>

#include "commands.h"
#include "input_error.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"

namespace appsync::host {

namespace {

int lint(const std::vector<std::string>& files) {
  int status = 0;
  for (const std::string& file : files) {
    ErrorRef error;
    auto bytes = readFile(file, &error);
    if (!bytes) {
      // A file that is not there is bad input; one that is not a valid property list is what
      // lint reports.
      std::fprintf(stderr, "%s: cannot read: %s\n", file.c_str(), error->describe().c_str());
      status = kExitBadInput;
      continue;
    }
    plist::ParseError parseError;
    plist::Format format;
    if (!plist::parse(*bytes, &parseError, &format)) {
      std::fprintf(stderr, "%s: %s\n", file.c_str(), parseError.message.c_str());
      status = std::max(status, kExitFailed);
      continue;
    }
    std::printf("%s: ok (%s)\n", file.c_str(), format == plist::Format::Xml ? "xml" : "binary");
  }
  return status;
}

int convert(const std::string& to, const std::string& in, const std::string& out) {
  ErrorRef error;
  auto bytes = readFile(in, &error);
  if (!bytes) {
    std::fprintf(stderr, "%s: cannot read: %s\n", in.c_str(), error->describe().c_str());
    return kExitBadInput;
  }
  plist::ParseError parseError;
  auto value = plist::parse(*bytes, &parseError);
  if (!value) {
    std::fprintf(stderr, "%s: %s\n", in.c_str(), parseError.message.c_str());
    return kExitBadInput;
  }
  auto format = to == "xml" ? plist::Format::Xml : plist::Format::Binary;
  if (!writePlistAtomically(out, *value, format, &error)) {
    std::fprintf(stderr, "%s: cannot write: %s\n", out.c_str(), error->describe().c_str());
    return 1;
  }
  return 0;
}

}  // namespace

void addPlistCommands(CLI::App& app, int& status) {
  auto* plistCommand = app.add_subcommand("plist", "Check and convert property-list files");
  plistCommand->require_subcommand(1);

  auto* lintCommand = plistCommand->add_subcommand(
      "lint", "Exit 0 when every file is a valid property list; else name the file and the place");
  auto files = std::make_shared<std::vector<std::string>>();
  lintCommand->add_option("FILE", *files, "Property-list files")->required();
  lintCommand->callback([files, &status] { status = lint(*files); });

  auto* convertCommand =
      plistCommand->add_subcommand("convert", "Rewrite a property list as XML or binary");
  auto to = std::make_shared<std::string>();
  auto in = std::make_shared<std::string>();
  auto out = std::make_shared<std::string>();
  convertCommand->add_option("--to", *to, "Output format")
      ->required()
      ->check(CLI::IsMember({"xml", "binary"}));
  convertCommand->add_option("IN", *in, "Input file")->required();
  convertCommand->add_option("-o,--output", *out, "Output file")->required();
  convertCommand->callback([to, in, out, &status] { status = convert(*to, *in, *out); });
}

}  // namespace appsync::host

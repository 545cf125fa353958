// Cross-checks the codec against Python's plistlib, an independent reader and writer of both
// formats: what we write it reads as intended, and what it writes we read as intended.
#include <gtest/gtest.h>

#include <cstdio>
#include <string>

#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "runtime/plist/plist_test_util.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync::plist {
namespace {

// The everyType() value in Python. Keys keep the C++ order; plistlib keeps file order.
constexpr const char* kScript = R"py(
import datetime, plistlib, sys

def every_type(uid):
    return {
        "string": "hello & <world>",
        "unicode": "caf\u00e9 \U0001F600",
        "empty": "",
        "true": True,
        "false": False,
        "zero": 0,
        "small": 255,
        "medium": 65536,
        "negative": -42,
        "int64min": -2**63,
        "int64max": 2**63 - 1,
        "uint64max": 2**64 - 1,
        "real": 3.25,
        "tiny": 1e-300,
        "third": 1.0 / 3,
        "date": datetime.datetime(2024, 2, 29, 12, 34, 56),
        "data": bytes((i * 37) % 256 for i in range(200)),
        "uid": uid,
        "array": [1, "two", [], {}],
        "nested": {"b": 1, "a": b""},
    }

def same(a, b):
    # Equal, with the same types and, for dictionaries, the same key order.
    if type(a) is not type(b):
        return False
    if isinstance(a, dict):
        return list(a) == list(b) and all(same(a[k], b[k]) for k in a)
    if isinstance(a, list):
        return len(a) == len(b) and all(same(x, y) for x, y in zip(a, b))
    return a == b

command, directory = sys.argv[1], sys.argv[2]
binary_value = every_type(plistlib.UID(7))
xml_value = every_type({"CF$UID": 7})
if command == "read":
    for name, fmt, expected in (("ours.xml", plistlib.FMT_XML, xml_value),
                                ("ours.bplist", plistlib.FMT_BINARY, binary_value)):
        with open(directory + "/" + name, "rb") as f:
            loaded = plistlib.load(f, fmt=fmt)
        if not same(loaded, expected):
            print(name, "differs:", loaded)
            sys.exit(1)
else:
    with open(directory + "/python.xml", "wb") as f:
        plistlib.dump(xml_value, f, fmt=plistlib.FMT_XML, sort_keys=False)
    with open(directory + "/python.bplist", "wb") as f:
        plistlib.dump(binary_value, f, fmt=plistlib.FMT_BINARY, sort_keys=False)
print("ok")
)py";

// Runs the script; returns its output, and its exit status in the last line when not zero.
std::string runScript(const appsync::testing::TempDir& dir, const std::string& command) {
  appsync::testing::writeText(dir / "check.py", kScript);
  const std::string line =
      "python3 '" + (dir / "check.py") + "' " + command + " '" + dir.str() + "' 2>&1";
  FILE* pipe = ::popen(line.c_str(), "r");
  if (!pipe) return "cannot run python3";
  std::string output;
  char buf[4096];
  for (std::size_t n; (n = std::fread(buf, 1, sizeof buf, pipe)) > 0;) output.append(buf, n);
  const int status = ::pclose(pipe);
  return status == 0 ? output : output + "\nexit status " + std::to_string(status);
}

TEST(PythonInteropTest, PythonReadsWhatWeWriteAndWeReadWhatPythonWrites) {
  appsync::testing::TempDir dir;
  ASSERT_TRUE(writeFileAtomically(dir / "ours.xml", *write(testing::everyType(), Format::Xml)));
  ASSERT_TRUE(
      writeFileAtomically(dir / "ours.bplist", *write(testing::everyType(), Format::Binary)));
  EXPECT_EQ(runScript(dir, "read"), "ok\n");

  ASSERT_EQ(runScript(dir, "write"), "ok\n");
  for (auto [name, format] :
       {std::pair{"python.xml", Format::Xml}, {"python.bplist", Format::Binary}}) {
    SCOPED_TRACE(name);
    ParseError error;
    Format detected;
    EXPECT_EQ(parse(readFile(dir / name).value_or(Bytes{}), &error, &detected),
              format == Format::Xml ? testing::everyTypeAsXmlReadsIt() : testing::everyType())
        << error.message;
    EXPECT_EQ(detected, format);
  }
}

}  // namespace
}  // namespace appsync::plist

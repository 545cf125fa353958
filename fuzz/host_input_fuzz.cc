// Fuzzes the readers of what people write for appsync-host: any text, read as a YAML document,
// as a device description and as a replay script. Bad input must end as an InputError (the
// message that names file, line and field); anything else, a crash, a hang or another
// exception, is a fault.
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "device_description.h"
#include "fuzz_support.h"
#include "input_error.h"
#include "replay/script.h"
#include "yaml_input.h"

using appsync::host::InputError;
using appsync::host::YamlField;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  // An empty directory: a description file that a script names is never found there.
  static const std::string directory = appsync::fuzz::workDir("host_input_fuzz");
  try {
    const YamlField document = YamlField::loadText(text, "fuzz.yaml");
    try {
      (void)document.plist();
    } catch (const InputError&) {
    }
    try {
      (void)appsync::host::deviceOptions(&document);
    } catch (const InputError&) {
    }
    try {
      (void)appsync::host::replay::readScript(document, directory);
    } catch (const InputError&) {
    }
  } catch (const InputError&) {
  }
  return 0;
}

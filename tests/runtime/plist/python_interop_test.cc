// Cross-checks the codec against Python's plistlib, an independent reader and writer of both
// formats: what we write it reads as intended, and what it writes we read as intended.
#include <gtest/gtest.h>

#include <cstdio>
#include <fstream>
#include <iterator>
#include <string>

#include "runtime/plist/codec.h"
#include "runtime/plist/plist_test_util.h"
#include "support/temp_dir.h"

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

class PythonInteropTest : public ::testing::Test {
 protected:
  void SetUp() override { std::ofstream(dir_ / "check.py") << kScript; }

  // Runs the script; returns its output (and exit status in the last line when non-zero).
  std::string runScript(const std::string& command) {
    std::string line =
        "python3 '" + (dir_ / "check.py") + "' " + command + " '" + dir_.str() + "' 2>&1";
    FILE* pipe = ::popen(line.c_str(), "r");
    if (!pipe) return "cannot run python3";
    std::string output;
    char buf[4096];
    std::size_t n;
    while ((n = std::fread(buf, 1, sizeof buf, pipe)) > 0) output.append(buf, n);
    int status = ::pclose(pipe);
    if (status != 0) output += "\nexit status " + std::to_string(status);
    return output;
  }

  void writeFile(const std::string& name, const Bytes& bytes) {
    std::ofstream(dir_ / name, std::ios::binary)
        .write(reinterpret_cast<const char*>(bytes.data()),
               static_cast<std::streamsize>(bytes.size()));
  }

  Bytes readFile(const std::string& name) {
    std::ifstream in(dir_ / name, std::ios::binary);
    return Bytes(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
  }

  appsync::testing::TempDir dir_;
};

TEST_F(PythonInteropTest, PythonReadsWhatWeWrite) {
  writeFile("ours.xml", *write(testing::everyType(), Format::Xml));
  writeFile("ours.bplist", *write(testing::everyType(), Format::Binary));
  EXPECT_EQ(runScript("read"), "ok\n");
}

TEST_F(PythonInteropTest, WeReadWhatPythonWrites) {
  ASSERT_EQ(runScript("write"), "ok\n");
  ParseError error;
  Format format;
  EXPECT_EQ(parse(readFile("python.xml"), &error, &format), testing::everyTypeAsXmlReadsIt())
      << error.message;
  EXPECT_EQ(format, Format::Xml);
  EXPECT_EQ(parse(readFile("python.bplist"), &error, &format), testing::everyType())
      << error.message;
  EXPECT_EQ(format, Format::Binary);
}

}  // namespace
}  // namespace appsync::plist

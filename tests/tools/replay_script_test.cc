// Malformed replay scripts: refused before any step runs, with exit status 2 and a message
// naming the file, the line, the step and the field; nothing is written.
#include <gtest/gtest.h>

#include <filesystem>
#include <sstream>
#include <string>

#include "replay/runner.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync {
namespace {

struct MalformedScript {
  const char* name;
  const char* text;
  const char* message;  // after the script's path
};

TEST(ReplayScriptTest, MalformedScriptsAreRefusedNamingLineStepAndField) {
  const MalformedScript cases[] = {
      {"malformed YAML", "steps:\n  - advance: 1s\n  - call: [a\n", ":4: not valid YAML"},
      {"step not a mapping", "steps:\n  - advance\n", ":2: steps[0]: a step is a mapping"},
      {"unknown action", "steps:\n  - advance: 1s\n  - jump: 3\n",
       ":3: steps[1].jump: unknown action \"jump\""},
      {"two actions", "steps:\n  - advance: 1s\n    expect: todo\n",
       ":3: steps[0].expect: a step has one action, and this one already has \"advance\""},
      {"background on an engine action", "steps:\n  - advance: 1s\n    background: b\n",
       ":3: steps[0].background: only call, plugin, event, stage and platform"},
      {"background name still running",
       "steps:\n  - call: x\n    background: b\n  - call: y\n    background: b\n",
       ":5: steps[1].background: \"b\" is still running"},
      {"result on a background step", "steps:\n  - call: x\n    background: b\n    result: 1\n",
       ":4: steps[0].result: a background step's result is checked by the step that awaits it"},
      {"await twice", "steps:\n  - call: x\n    background: b\n  - await: b\n  - await: b\n",
       ":5: steps[2].await: no step started \"b\""},
      {"unknown expectation", "steps:\n  - expect: weather\n",
       ":2: steps[0].expect: unknown expectation \"weather\""},
      {"field of another expectation", "steps:\n  - expect: todo\n    app: a\n    path: x\n",
       ":4: steps[0].path: unknown field \"path\""},
      {"todo state and absent",
       "steps:\n  - expect: todo\n    app: a\n    state: SENT\n"
       "    absent: true\n",
       ":2: steps[0]: the expectation takes only one of state or absent"},
      {"absolute path", "steps:\n  - expect: file\n    path: /etc/passwd\n",
       ":3: steps[0].path: \"/etc/passwd\" is absolute"},
      {"path leaving the root", "steps:\n  - expect: file\n    path: var/../../x\n",
       ":3: steps[0].path: \"var/../../x\" has a \"..\" component: paths on the device only go "
       "down"},
      {"empty value, reported on its key's line",
       "steps:\n  - expect: file\n    path:\n    exists: true\n",
       ":3: steps[0].path: expected a text"},
      {"missing device file", "device: nowhere.yaml\nsteps: []\n",
       ":1: device: no description file at"},
  };
  for (const MalformedScript& c : cases) {
    SCOPED_TRACE(c.name);
    testing::TempDir dir;
    const std::filesystem::path script = dir.path() / "script.yaml";
    testing::writeText(script, c.text);
    const std::filesystem::path root = dir.path() / "device";
    std::ostringstream out, errors;
    EXPECT_EQ(host::replay::replay({.script = script, .root = root}, out, errors),
              host::kExitBadInput);
    EXPECT_NE(errors.str().find(script.string() + c.message), std::string::npos) << errors.str();
    EXPECT_EQ(out.str(), "");
    EXPECT_FALSE(std::filesystem::exists(root));
  }
}

}  // namespace
}  // namespace appsync

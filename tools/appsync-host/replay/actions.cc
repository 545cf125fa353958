// runAction: the step's selector picks the family of actions.
#include "replay/actions.h"

#include <string>

namespace appsync::host::replay {

ActionResult runAction(StepContext& context) {
  const std::string& selector = context.selector;
  if (selector == "call") return runHostCall(context);
  if (selector == "plugin") return runPluginCall(context);
  if (selector == "event") return runPlatformEvent(context);
  if (selector == "stage") return runHostComputer(context);
  if (selector == "platform") return runPlatformChange(context);
  context.step.fail("unknown action \"" + selector +
                    "\" (expected one of: call, plugin, event, stage, platform)");
}

}  // namespace appsync::host::replay

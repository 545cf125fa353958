// The five families of replay actions, each in a file of its own; runAction picks one by the
// step's selector.
#pragma once

#include "replay/step_context.h"

namespace appsync::host::replay {

ActionResult runHostCall(StepContext& context);        // call:     host_calls.cc
ActionResult runPluginCall(StepContext& context);      // plugin:   plugin_calls.cc
ActionResult runPlatformEvent(StepContext& context);   // event:    platform_events.cc
ActionResult runHostComputer(StepContext& context);    // stage:    host_computer.cc
ActionResult runPlatformChange(StepContext& context);  // platform: platform_changes.cc

}  // namespace appsync::host::replay

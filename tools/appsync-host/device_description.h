// A device described by hand in YAML: the road, whether the client runs inside the host daemon,
// installed apps, placeholders, restrictions, icon order, backup data and the files the host
// computer left. `device init --from` and a replay script's `device:` build devices from it.
// docs/device-description.md documents every field with examples.
#pragma once

#include "device_session.h"
#include "platform/fake/fake_platform.h"
#include "yaml_input.h"

namespace appsync::host {

// The options the device is created with (road, host daemon or not), read from the
// description; an absent description gives the default device's. Throws InputError.
FakePlatform::Options deviceOptions(const YamlField* description);

// Puts everything else the description names into the new device: registry records with real
// bundle folders (Info.plist and icon), store metadata files, placeholders, restrictions, icon
// order, backup data, the demoted-apps and last-sync lists. Without a description, a small
// default device. Throws InputError naming the field; writes nothing outside the root.
void applyDescription(DeviceSession& session, const YamlField* description);

}  // namespace appsync::host

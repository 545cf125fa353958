// Saved state of the fake system facilities: named notifications, ownerships and the main
// bundle identifier.
#include <algorithm>
#include <climits>

#include "platform/fake/fake_system.h"
#include "platform/fake/state_fields.h"

namespace appsync {

plist::Dict FakeSystemServices::saveState() const {
  std::lock_guard lock(mutex_);
  plist::Dict notifications;
  for (const auto& [name, notification] : notifications_) {
    plist::Dict entry;
    if (notification.token != 0) entry.set("token", notification.token);
    if (notification.state) entry.set("state", plist::Integer::fromUnsigned(*notification.state));
    // One record per post, with the state the notification had then.
    plist::Array posts;
    for (const std::optional<std::uint64_t>& state : notification.statesAtPosts) {
      posts.emplace_back(state ? plist::Dict{{"state", plist::Integer::fromUnsigned(*state)}}
                               : plist::Dict{});
    }
    entry.set("posts", std::move(posts));
    notifications.set(name, std::move(entry));
  }
  plist::Dict ownerships;
  for (const auto& [path, record] : ownerships_) {
    ownerships.set(
        path,
        plist::Dict{{"owner", record.owner}, {"group", record.group}, {"applied", record.applied}});
  }
  return {{"mainBundleIdentifier", mainBundleIdentifier_},
          {"notifications", std::move(notifications)},
          {"ownerships", std::move(ownerships)}};
}

void FakeSystemServices::loadState(const StateFields& state) {
  std::map<std::string, Notification> notifications;
  std::map<int, std::string> tokenNames;
  int nextToken = 1;
  if (const std::optional<StateFields> saved = state.optionalChild("notifications")) {
    for (const auto& entry : saved->dict()) {
      const StateFields fields = saved->child(entry.key);
      Notification notification;
      if (fields.has("token")) {
        notification.token = fields.int32("token");
        if (notification.token < 1 || notification.token == INT_MAX) {
          fields.fail("token", "expected a positive token");
        }
        auto [other, added] = tokenNames.emplace(notification.token, entry.key);
        if (!added) fields.fail("token", "already the token of " + other->second);
        nextToken = std::max(nextToken, notification.token + 1);
      }
      notification.state = fields.optionalUnsigned("state");
      for (const StateFields& post : fields.records("posts")) {
        notification.statesAtPosts.push_back(post.optionalUnsigned("state"));
      }
      notification.posts = notification.statesAtPosts.size();
      notifications.emplace(entry.key, std::move(notification));
    }
  }
  std::map<std::string, Ownership> ownerships;
  if (const std::optional<StateFields> saved = state.optionalChild("ownerships")) {
    for (const auto& entry : saved->dict()) {
      const StateFields fields = saved->child(entry.key);
      ownerships[entry.key] = {fields.string("owner"), fields.string("group"),
                               fields.boolean("applied", false)};
    }
  }
  std::optional<std::string> mainBundleIdentifier = state.optionalString("mainBundleIdentifier");
  std::lock_guard lock(mutex_);
  notifications_ = std::move(notifications);
  tokenNames_ = std::move(tokenNames);
  nextToken_ = nextToken;
  ownerships_ = std::move(ownerships);
  if (mainBundleIdentifier) mainBundleIdentifier_ = std::move(*mainBundleIdentifier);
}

}  // namespace appsync

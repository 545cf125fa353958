// A group counts work in flight; waiters block until it is empty.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <mutex>

#include "runtime/dispatch/clock.h"

namespace appsync {

class Group {
 public:
  Group() = default;
  Group(const Group&) = delete;
  Group& operator=(const Group&) = delete;

  void enter();
  // Leaving more often than entering is a programming error and aborts.
  void leave();
  std::int64_t count() const;

  // Blocks until the group is empty. No time limit.
  void wait();
  // Blocks until the group is empty or `clock` reaches `deadline`. True when it emptied.
  bool waitUntil(Clock& clock, TimePoint deadline);

 private:
  mutable std::mutex mutex_;
  std::condition_variable cv_;
  std::int64_t count_ = 0;
};

// One membership of a group, held for as long as this object lives: entered at construction,
// left at destruction. Lets work that may be dropped unrun (a closure destroyed by its queue)
// still leave the group.
class GroupMembership {
 public:
  explicit GroupMembership(Group& group) : group_(group) { group_.enter(); }
  ~GroupMembership() { group_.leave(); }
  GroupMembership(const GroupMembership&) = delete;
  GroupMembership& operator=(const GroupMembership&) = delete;

 private:
  Group& group_;
};

}  // namespace appsync

// The objects of the fake install-coordination service (promises, placeholders, coordinators,
// observer registrations), with the inspection accessors that tests use.
//
// Ownership: a coordinator owns its promises and placeholder; a placeholder owns its icon
// promise. Back-references (promise or placeholder to coordinator, every object to the service)
// are weak, so nothing keeps itself alive and an object outliving its service still answers
// (it then simply stops reporting changes).
//
// Every object is safe to use from several threads. Each guards its own state with a lock.
// Locks nest only one way: a coordinator's may be held while asking its placeholder, and any
// object's while counting a call with the service; the service never calls an object while
// holding its own lock, and nothing is held while calling an observer.
#pragma once

#include "platform/fake/fake_kc_coordinator.h"
#include "platform/fake/fake_kc_observer.h"
#include "platform/fake/fake_kc_placeholder.h"
#include "platform/fake/fake_kc_promise.h"
#include "platform/fake/fake_kc_service_hooks.h"

#pragma once
#include "tests/support/fake_daemon.h"  // FakeSearchDaemon is a FakeDaemon.

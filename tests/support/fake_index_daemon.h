#pragma once
#include "tests/support/fake_daemon.h"  // FakeIndexDaemon is a FakeDaemon.

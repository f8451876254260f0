// Process-wide serialisation of platform user-database calls.
#pragma once

#include "common/mutex.h"

namespace vellis::sdk {

// The one process-wide mutex held around every call into the platform's user
// and share databases and every switch of identity. Created on first use,
// never destroyed. Take it with LockMutex.
Mutex& SDKMutex();

}  // namespace vellis::sdk

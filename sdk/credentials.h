// The switch of the effective user, and the mutex that serialises it with
// every other call into the platform's user and share databases.
#pragma once

#include <cstdint>
#include <string>

#include "common/mutex.h"

namespace vellis::sdk {

// The one process-wide mutex held around every call into the platform's user
// and share databases and every switch of identity. Created on first use,
// never destroyed. Take it with LockMutex.
Mutex& SDKMutex();

// A scoped switch of the effective user and group.
//
// Effective ids belong to the whole process: while one SDKCredentials has
// switched, no other thread may do file work that depends on the identity,
// and scopes must nest (each restores what it captured). Each construction,
// switch and switch back holds SDKMutex() for its duration only.
class SDKCredentials {
 public:
  // Captures the effective user and group ids and the name of that user.
  // Throws Error 503 "QORUUserGetByUID failed, err=<n>" when the platform
  // does not know the user.
  SDKCredentials();

  // SDKCredentials() followed by AsUser(username).
  explicit SDKCredentials(const std::string& username);

  // Switches the effective user to `username`, or to "root" when `username`
  // is a member of the administrators group ("root" itself is taken as it
  // is). Throws Error 503 when the switch fails; the ids are then as before.
  void AsUser(const std::string& username);

  // Switches back to the captured user when the effective user or group
  // differ from the captured ones; otherwise does nothing. A failed switch
  // back throws Error 503: it is never swallowed, so the process cannot go on
  // unnoticed under a foreign identity (during the unwinding of another
  // exception this ends the process).
  ~SDKCredentials() noexcept(false);

  SDKCredentials(const SDKCredentials&) = delete;
  SDKCredentials& operator=(const SDKCredentials&) = delete;

 private:
  uint32_t euid_;
  uint32_t egid_;
  std::string username_;
};

}  // namespace vellis::sdk

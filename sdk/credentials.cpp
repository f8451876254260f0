#include "sdk/credentials.h"

namespace vellis::sdk {

Mutex& SDKMutex() {
  static Mutex* mutex = new Mutex();  // never destroyed: used until exit
  return *mutex;
}

}  // namespace vellis::sdk

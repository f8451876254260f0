#include "sdk/linux/unicode.h"

#include <unicase.h>
#include <unistr.h>

#include <cstdint>

#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

const uint8_t* Bytes(const std::string& s) { return reinterpret_cast<const uint8_t*>(s.data()); }

}  // namespace

int Utf8CaseCompare(const std::string& a, const std::string& b) {
  int result = 0;
  // u8_casecmp would fail on ill-formed text; such text has no case to fold.
  if (u8_check(Bytes(a), a.size()) == nullptr && u8_check(Bytes(b), b.size()) == nullptr &&
      u8_casecmp(Bytes(a), a.size(), Bytes(b), b.size(), nullptr, nullptr, &result) == 0) {
    return result;
  }
  int c = a.compare(b);
  return c < 0 ? -1 : (c > 0 ? 1 : 0);
}

int LinuxPlatform::QLIBCUnicodeUTF8StrCaseCmp(const std::string& a, const std::string& b) {
  return Utf8CaseCompare(a, b);
}

}  // namespace vellis::sdk

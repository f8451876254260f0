#include "common/error.h"

namespace vellis {
namespace {

std::string Compose(ErrorCode code, const std::string& reason) {
  std::string msg = "Vellis error, code=" + std::to_string(static_cast<int32_t>(code));
  if (!reason.empty()) msg += ", reason=[" + reason + "]";
  return msg;
}

}  // namespace

Error::Error(ErrorCode code) : Error(code, std::string()) {}

Error::Error(ErrorCode code, const std::string& reason)
    : std::runtime_error(Compose(code, reason)), code_(code), reason_(reason) {}

const char* Error::what() const noexcept { return reason_.c_str(); }

}  // namespace vellis

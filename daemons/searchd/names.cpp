#include "daemons/searchd/names.h"

#include "daemons/searchd/error_codes.h"

namespace vellis::searchd {
namespace {

// Makes control characters visible in messages.
std::string Printable(const std::string& s) {
  std::string out;
  for (unsigned char c : s) {
    if (c < 0x20 || c == 0x7f) {
      static const char kHex[] = "0123456789abcdef";
      out += "\\x";
      out.push_back(kHex[c >> 4]);
      out.push_back(kHex[c & 15]);
    } else {
      out.push_back(static_cast<char>(c));
    }
  }
  return out;
}

}  // namespace

void CheckIndexId(const std::string& id) {
  auto bad = [&id](const std::string& why) {
    throw Error(kErrBadIndexId, "Bad index id \"" + Printable(id) + "\": " + why);
  };
  if (id.empty()) bad("empty");
  if (id.size() > kMaxIndexIdBytes)
    bad("longer than " + std::to_string(kMaxIndexIdBytes) + " bytes");
  if (id == "." || id == "..") bad("\".\" and \"..\" are not names");
  for (unsigned char c : id) {
    if (c == '/') bad("contains \"/\"");
    if (c == 0) bad("contains NUL");
    if (c < 0x20 || c == 0x7f) bad("contains a control character");
  }
}

void CheckDbFolder(const std::string& path) {
  auto bad = [&path](const std::string& why) {
    throw Error(kErrBadIndexId, "Bad database folder \"" + Printable(path) + "\": " + why);
  };
  if (path.empty() || path[0] != '/') bad("not an absolute path");
  if (path.find('\0') != std::string::npos) bad("contains NUL");
  size_t pos = 0;
  while (pos <= path.size()) {
    size_t next = path.find('/', pos);
    std::string part = path.substr(pos, next == std::string::npos ? std::string::npos : next - pos);
    if (part == "." || part == "..") bad("contains a \"" + part + "\" component");
    if (next == std::string::npos) break;
    pos = next + 1;
  }
}

}  // namespace vellis::searchd

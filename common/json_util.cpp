#include "common/json_util.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <unistr.h>

#include <cerrno>
#include <climits>
#include <cstring>
#include <memory>
#include <sstream>

namespace vellis {
namespace {

constexpr size_t kMaxJsonFileBytes = 64u << 20;

Json::CharReader* ThreadReader() {
  thread_local std::unique_ptr<Json::CharReader> reader = [] {
    Json::CharReaderBuilder b;
    b["collectComments"] = false;
    b["allowComments"] = false;
    b["allowTrailingCommas"] = false;
    b["allowSingleQuotes"] = false;
    b["allowSpecialFloats"] = false;
    b["failIfExtra"] = true;
    b["stackLimit"] = 1000;
    return std::unique_ptr<Json::CharReader>(b.newCharReader());
  }();
  return reader.get();
}

Json::StreamWriter* ThreadWriter(bool indented) {
  auto make = [](const char* indentation) {
    Json::StreamWriterBuilder b;
    b["indentation"] = indentation;
    b["emitUTF8"] = true;
    b["commentStyle"] = "None";
    return std::unique_ptr<Json::StreamWriter>(b.newStreamWriter());
  };
  thread_local std::unique_ptr<Json::StreamWriter> compact = make("");
  thread_local std::unique_ptr<Json::StreamWriter> pretty = make("   ");
  return indented ? pretty.get() : compact.get();
}

bool WriteAll(int fd, const std::string& data) {
  size_t off = 0;
  while (off < data.size()) {
    ssize_t n = write(fd, data.data() + off, data.size() - off);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    off += static_cast<size_t>(n);
  }
  return true;
}

}  // namespace

bool JsonFromString(Json::Value& out, const std::string& text) {
  return JsonFromChars(out, text);
}

bool JsonFromChars(Json::Value& out, std::string_view text) {
  if (text.empty()) return false;  // no JSON text is empty; an empty view may hold no pointer
  // Valid JSON text holds no raw NUL; jsoncpp would let one through inside a
  // string, and jsoncpp does not check UTF-8 at all.
  if (memchr(text.data(), '\0', text.size()) != nullptr) return false;
  if (u8_check(reinterpret_cast<const uint8_t*>(text.data()), text.size()) != nullptr) {
    return false;
  }
  try {
    return ThreadReader()->parse(text.data(), text.data() + text.size(), &out, nullptr);
  } catch (const std::exception&) {
    return false;  // jsoncpp throws past its nesting limit
  }
}

std::string JsonToString(const Json::Value& v) {
  std::ostringstream os;
  ThreadWriter(false)->write(v, &os);
  return os.str();
}

bool JsonFromFile(Json::Value& out, const std::string& path) {
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
  if (fd < 0) return false;
  struct stat st;
  if (fstat(fd, &st) != 0 || !S_ISREG(st.st_mode) ||
      static_cast<uint64_t>(st.st_size) > kMaxJsonFileBytes) {
    close(fd);
    errno = EINVAL;
    return false;
  }
  std::string text;
  text.resize(static_cast<size_t>(st.st_size));
  size_t off = 0;
  while (off < text.size()) {
    ssize_t n = read(fd, &text[off], text.size() - off);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) break;
    off += static_cast<size_t>(n);
  }
  close(fd);
  text.resize(off);
  return JsonFromString(out, text);
}

bool JsonToFile(const Json::Value& v, const std::string& path) {
  std::ostringstream os;
  ThreadWriter(true)->write(v, &os);
  os << '\n';
  std::string tmpl = path + ".tmp-XXXXXX";
  int fd = mkostemp(&tmpl[0], O_CLOEXEC);
  if (fd < 0) return false;
  bool ok = WriteAll(fd, os.str()) && fchmod(fd, 0644) == 0 && fsync(fd) == 0;
  int saved = errno;
  if (close(fd) != 0 && ok) {
    ok = false;
    saved = errno;
  }
  if (ok && rename(tmpl.c_str(), path.c_str()) == 0) {
    // Make the rename itself durable; a failure here loses no data.
    std::string dir = path.substr(0, path.rfind('/') == std::string::npos ? 0 : path.rfind('/'));
    int dfd = open(dir.empty() ? "." : dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (dfd >= 0) {
      fsync(dfd);
      close(dfd);
    }
    return true;
  }
  if (ok) saved = errno;
  unlink(tmpl.c_str());
  errno = saved;
  return false;
}

template <>
bool isJsonType<std::string>(const Json::Value& v) {
  return v.isConvertibleTo(Json::stringValue);
}
template <>
bool isJsonType<bool>(const Json::Value& v) {
  return v.isConvertibleTo(Json::booleanValue);
}
template <>
bool isJsonType<int>(const Json::Value& v) {
  return v.isConvertibleTo(Json::intValue);
}
template <>
bool isJsonType<unsigned int>(const Json::Value& v) {
  return v.isConvertibleTo(Json::uintValue);
}
template <>
bool isJsonType<long long>(const Json::Value& v) {
  // jsoncpp has no 64-bit type tag: its 32-bit test, widened by isInt64.
  return v.isConvertibleTo(Json::intValue) || v.isInt64();
}
template <>
bool isJsonType<double>(const Json::Value& v) {
  return v.isConvertibleTo(Json::realValue);
}

template <>
std::string asJsonType<std::string>(const Json::Value& v) {
  return v.asString();
}
template <>
bool asJsonType<bool>(const Json::Value& v) {
  return v.asBool();
}
template <>
int asJsonType<int>(const Json::Value& v) {
  return v.asInt();
}
template <>
unsigned int asJsonType<unsigned int>(const Json::Value& v) {
  return v.asUInt();
}
template <>
long long asJsonType<long long>(const Json::Value& v) {
  return static_cast<long long>(v.asInt64());
}
template <>
double asJsonType<double>(const Json::Value& v) {
  return v.asDouble();
}

std::string AppendData(const Json::Value& v) { return ", data=" + JsonToString(v); }

namespace {

void CheckObject(const Json::Value& obj) {
  if (!obj.isObject()) throw Error(kErrBadArgument, "Not an object" + AppendData(obj));
}

void CheckRequired(const Json::Value& obj, const std::string& key) {
  if (!obj.isMember(key)) {
    throw Error(kErrBadArgument, "Missing property: " + key + AppendData(obj));
  }
}

}  // namespace

template <typename T>
void GetJsonValue(T& out, const Json::Value& obj, const std::string& key, bool required) {
  CheckObject(obj);
  const Json::Value* member = obj.find(key.data(), key.data() + key.size());
  if (required) {
    if (member == nullptr) CheckRequired(obj, key);
    if (!isJsonType<T>(*member)) throw Error(kErrBadArgument, "Not a string" + AppendData(obj));
    out = asJsonType<T>(*member);
    return;
  }
  if (member != nullptr && isJsonType<T>(*member)) out = asJsonType<T>(*member);
}

template <>
void GetJsonValue<Json::Value>(Json::Value& out, const Json::Value& obj, const std::string& key,
                               bool required) {
  CheckObject(obj);
  const Json::Value* member = obj.find(key.data(), key.data() + key.size());
  if (required && member == nullptr) CheckRequired(obj, key);
  if (member != nullptr) out = *member;
}

template void GetJsonValue<std::string>(std::string&, const Json::Value&, const std::string&,
                                        bool);
template void GetJsonValue<bool>(bool&, const Json::Value&, const std::string&, bool);
template void GetJsonValue<int>(int&, const Json::Value&, const std::string&, bool);
template void GetJsonValue<unsigned int>(unsigned int&, const Json::Value&, const std::string&,
                                         bool);
template void GetJsonValue<long long>(long long&, const Json::Value&, const std::string&, bool);
template void GetJsonValue<double>(double&, const Json::Value&, const std::string&, bool);

template <>
Json::Value Vec2JsonArr<std::string>(const std::vector<std::string>& vec) {
  Json::Value arr(Json::arrayValue);
  for (const auto& s : vec) arr.append(s);
  return arr;
}

template <>
std::vector<std::string> JsonArr2Vec<std::string>(const Json::Value& arr) {
  std::vector<std::string> vec;
  if (!arr.isArray()) return vec;
  vec.reserve(arr.size());
  for (const auto& v : arr) {
    if (!isJsonType<std::string>(v)) throw Error(kErrBadArgument, "Not a string" + AppendData(arr));
    vec.push_back(v.asString());
  }
  return vec;
}

void JsonApplyChanges(Json::Value& target, const Json::Value& changes) {
  if (!changes.isObject()) return;
  for (auto it = changes.begin(); it != changes.end(); ++it) {
    const std::string key = it.name();
    if (it->isNull()) {
      if (target.isObject()) target.removeMember(key);
    } else if (it->isObject()) {
      if (!target.isObject()) target = Json::Value(Json::objectValue);
      // Made an object here, not in the recursion: a change set that only
      // removes keys (or is empty) must still leave an object, not null.
      Json::Value& sub = target[key];
      if (!sub.isObject()) sub = Json::Value(Json::objectValue);
      JsonApplyChanges(sub, *it);
    } else {
      if (!target.isObject()) target = Json::Value(Json::objectValue);
      target[key] = *it;
    }
  }
}

}  // namespace vellis

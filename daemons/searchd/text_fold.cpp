#include "daemons/searchd/text_fold.h"

#include <unicase.h>
#include <unictype.h>
#include <unistr.h>

#include <cstdlib>

namespace vellis::searchd {

std::string FoldCase(const std::string& text) {
  if (text.empty()) return text;
  const auto* in = reinterpret_cast<const uint8_t*>(text.data());
  if (u8_check(in, text.size()) != nullptr) return text;
  size_t n = 0;
  uint8_t* out = u8_tolower(in, text.size(), nullptr, nullptr, nullptr, &n);
  if (out == nullptr) return text;
  std::string result(reinterpret_cast<char*>(out), n);
  free(out);
  return result;
}

std::vector<std::string> SplitBlanks(const std::string& text) {
  std::vector<std::string> out;
  std::string cur;
  for (char c : text) {
    if (c == ' ' || c == '\t' || c == '\r' || c == '\n' || c == '\f' || c == '\v') {
      if (!cur.empty()) out.push_back(std::move(cur));
      cur.clear();
    } else {
      cur.push_back(c);
    }
  }
  if (!cur.empty()) out.push_back(std::move(cur));
  return out;
}

std::string HexToken(const std::string& text) {
  static const char kDigits[] = "0123456789abcdef";
  std::string out;
  out.reserve(text.size() * 2);
  for (unsigned char c : text) {
    out.push_back(kDigits[c >> 4]);
    out.push_back(kDigits[c & 15]);
  }
  return out;
}

std::string FtsQuote(const std::string& text) {
  std::string out = "\"";
  for (char c : text) {
    if (c == '"') out.push_back('"');
    out.push_back(c);
  }
  out.push_back('"');
  return out;
}

size_t CodePointCount(const std::string& text) {
  size_t n = 0;
  for (unsigned char c : text) {
    if ((c & 0xC0) != 0x80) ++n;
  }
  return n;
}

std::vector<std::string> Words(const std::string& text) {
  std::vector<std::string> out;
  const auto* s = reinterpret_cast<const uint8_t*>(text.data());
  size_t size = text.size();
  size_t pos = 0;
  size_t start = std::string::npos;
  while (pos < size) {
    ucs4_t uc = 0;
    int len = u8_mbtouc(&uc, s + pos, size - pos);
    bool word_char = uc_is_alpha(uc) || uc_is_digit(uc);
    if (word_char && start == std::string::npos) start = pos;
    if (!word_char && start != std::string::npos) {
      out.push_back(FoldCase(text.substr(start, pos - start)));
      start = std::string::npos;
    }
    pos += static_cast<size_t>(len > 0 ? len : 1);
  }
  if (start != std::string::npos) out.push_back(FoldCase(text.substr(start)));
  return out;
}

std::string Utf8Prefix(const std::string& text, size_t max_bytes) {
  if (text.size() <= max_bytes) return text;
  size_t cut = max_bytes;
  while (cut > 0 && (static_cast<unsigned char>(text[cut]) & 0xC0) == 0x80) --cut;
  return text.substr(0, cut);
}

}  // namespace vellis::searchd

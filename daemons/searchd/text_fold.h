// Text normalisation shared by indexing and querying, so both sides of a
// match see the same forms.
#pragma once

#include <string>
#include <vector>

namespace vellis::searchd {

// `text` (UTF-8) in lower case by the Unicode rules (libunistring). Invalid
// UTF-8 is returned unchanged. Thread-safe.
std::string FoldCase(const std::string& text);

// Splits on blanks (space, tab, CR, LF, FF, VT); no empty pieces.
std::vector<std::string> SplitBlanks(const std::string& text);

// `text` as lower-case hexadecimal: a form that the full-text tokenizer keeps
// as one token whatever characters the text holds, and whose prefixes are the
// forms of the text's prefixes.
std::string HexToken(const std::string& text);

// `text` quoted as one FTS5 string (inner quotes doubled), so that query text
// never reaches FTS5 as syntax.
std::string FtsQuote(const std::string& text);

// The number of code points of valid UTF-8 `text` (bytes that do not start a
// code point are not counted).
size_t CodePointCount(const std::string& text);

// The words of `text`: maximal runs of letters and digits (Unicode), folded
// to lower case.
std::vector<std::string> Words(const std::string& text);

// At most `max_bytes` of `text`, cut back to a code point boundary.
std::string Utf8Prefix(const std::string& text, size_t max_bytes);

}  // namespace vellis::searchd

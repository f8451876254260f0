// Case-insensitive comparison of UTF-8 text.
#pragma once

#include <string>

namespace vellis::sdk {

// Compares `a` and `b` after Unicode case folding (full folding, so "Straße"
// equals "STRASSE"): negative, 0 or positive. Text that is not well-formed
// UTF-8 is compared byte for byte. Thread-safe.
int Utf8CaseCompare(const std::string& a, const std::string& b);

}  // namespace vellis::sdk

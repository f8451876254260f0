// The file-sharing service's configuration file, edited as plain INI text.
//
// Only one option is ever read or written: "spotlight" of the [global]
// section, the service's switch for search support. The text functions are
// pure so that the edit can be tested without a file.
#pragma once

#include <optional>
#include <string>

namespace vellis::sdk {

// The configuration file, resolved with RootPath() at use.
inline constexpr char kSmbConfPath[] = "/etc/samba/smb.conf";

// The value of `key` in the section `section`, as the service reads it:
// section and key names compare ignoring case, and spaces and tabs inside a
// key name do not count ("Spot Light" is "spotlight"); lines beginning with
// "#" or ";" are comments; a line ending in "\" continues on the next; the
// value is trimmed; where the key appears more than once (also in repeated
// sections of one name) the last one counts. Empty when the key is absent.
std::optional<std::string> GetIniOption(const std::string& text, const std::string& section,
                                        const std::string& key);

// `text` with `key` of `section` set to `value`: every line that sets the key
// in that section is rewritten as "<its indentation><key> = <value>" (a line
// continued with "\" is rewritten whole); when none does, the line
// "\t<key> = <value>" is added after the last setting of the section's first
// occurrence; when there is no such section, "[<section>]" and that line are
// put before everything else. All other lines, comments and line endings are
// kept byte for byte.
std::string SetIniOption(const std::string& text, const std::string& section,
                         const std::string& key, const std::string& value);

// True for the service's words of a true boolean: "yes", "true", "on", "1"
// (any case).
bool IsIniTrue(const std::string& value);

}  // namespace vellis::sdk

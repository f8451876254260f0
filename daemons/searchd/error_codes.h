// Error codes of the search daemon's answers.
//
// They travel in {"success": false, "error": {"code", "msg"}} and reach the
// library's callers unchanged as vellis::Error codes. 1400 and 1401 are the
// busy codes on which clients wait and repeat the whole request; no other
// failure uses them. docs/searchd.md lists when each is sent.
#pragma once

#include "common/error.h"

namespace vellis::searchd {

// The request text is not a JSON object (syntax, encoding, trailing bytes).
inline constexpr ErrorCode kErrMalformedRequest = static_cast<ErrorCode>(1100);
// "command" names no command of the daemon.
inline constexpr ErrorCode kErrUnknownCommand = static_cast<ErrorCode>(1101);
// A member is missing or of the wrong type.
inline constexpr ErrorCode kErrBadMember = static_cast<ErrorCode>(1102);
// An index id or database folder that cannot name a file safely.
inline constexpr ErrorCode kErrBadIndexId = static_cast<ErrorCode>(1103);
// No index has this id.
inline constexpr ErrorCode kErrIndexNotFound = static_cast<ErrorCode>(1104);
// The id is taken (by an index in another folder, or as a rename target).
inline constexpr ErrorCode kErrIndexExists = static_cast<ErrorCode>(1105);
// A write to a paused index.
inline constexpr ErrorCode kErrIndexPaused = static_cast<ErrorCode>(1106);
// "document_set_by_id" or a suggestion refresh on an unknown document.
inline constexpr ErrorCode kErrDocumentNotFound = static_cast<ErrorCode>(1107);
// A document lacks a field that the mappings mark "required".
inline constexpr ErrorCode kErrRequiredField = static_cast<ErrorCode>(1108);
// A field value does not fit the field's type (int, double, bool, text).
inline constexpr ErrorCode kErrFieldType = static_cast<ErrorCode>(1109);
// A search request that cannot be run (bad sort key, range, field).
inline constexpr ErrorCode kErrBadQuery = static_cast<ErrorCode>(1110);
// The mappings handed to "index_create" are unusable.
inline constexpr ErrorCode kErrBadMappings = static_cast<ErrorCode>(1111);
// The storage failed (disk full, I/O error, corrupt database).
inline constexpr ErrorCode kErrStorage = static_cast<ErrorCode>(1112);
// Busy: the index's database is write-locked by another process beyond the
// daemon's short wait. Retry later.
inline constexpr ErrorCode kErrBusyLocked = kErrBusy;

}  // namespace vellis::searchd

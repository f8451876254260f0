// The index schema of a share: metadata field names, the index settings,
// the field mappings and the event handler handed to the search daemon when
// an index is created.
//
// The field names are those of sdk/metadata_fields.h, reachable here as
// elastic::kQORUMD... .
#pragma once

#include <json/json.h>

#include "sdk/metadata_fields.h"

namespace vellis::fileindex::elastic {

// The field names and extraction options live with the platform's content
// extraction, which fills them; the schema uses them under its own name.
using namespace ::vellis::sdk::metadata;  // NOLINT(google-build-using-namespace)

// The event-handler library the daemon loads for each share index.
inline constexpr char kEventHandlerLibPath[] =
    "/var/packages/Vellis/target/handler/fileindex_event_handler.so";

// The mappings template: "property_id", "default" and the 53 "properties" in
// their fixed order. The JSON library keeps object members sorted by key, so
// this text is the one place where that order is kept.
extern const char kFileIndexMappingsText[];

// The number of fields under "properties" of the mappings.
inline constexpr int kFileIndexMappedFields = 53;

// An object without members (serialises as {}, never as null).
Json::Value GetFileIndexSettings();

// The parsed mappings template. Throws Error 502 if the constant text does
// not parse (it always does).
Json::Value GetFileIndexMappings();

// {"lib_path": kEventHandlerLibPath}. Throws Error 502 if the constant text
// does not parse (it always does).
Json::Value GetFileIndexEventHandler();

}  // namespace vellis::fileindex::elastic

#include "fileindex/elastic/schema.h"

#include "common/json_util.h"
#include "common/log.h"

namespace vellis::fileindex::elastic {

// Kept in the daemon's field order; fields not listed take "default".
const char kFileIndexMappingsText[] = R"JSON({
  "property_id": "QORUMDPath",
  "default": {"type": "string", "analyzer": "qorustandard", "required": false, "stored": true, "_all": true},
  "properties": {
    "QORUMDPath": {"analyzer": "keyword", "required": true, "_all": false},
    "QORUMDFSName": {"analyzer": "keyword", "_all": false},
    "QORUMDPrivilege": {"analyzer": "keyword", "_all": false},
    "QORUMDIsDir": {"type": "bool", "_all": false},
    "QORUMDOwnerUserID": {"analyzer": "keyword", "_all": false},
    "QORUMDOwnerGroupID": {"analyzer": "keyword", "_all": false},
    "QORUMDFSSize": {"type": "int"},
    "QORUMDFSContentChangeDate": {"type": "int"},
    "QORUMDAttributeChangeDate": {"type": "int"},
    "QORUMDFSCreationDate": {"type": "int"},
    "QORUMDContentModificationDate": {"type": "int"},
    "QORUMDLastUsedDate": {"type": "int"},
    "QORUMDContentCreationDate": {"type": "int"},
    "QORUMDAuthors": {"type": "text", "analyzer": "white space"},
    "QORUMDTitle": {"type": "text"},
    "QORUMDAlbum": {"type": "text"},
    "QORUMDIdentifier": {"type": "text", "analyzer": "keyword", "_all": false},
    "QORUMDAudioTrackNumber": {"type": "int"},
    "QORUMDRecordingYear": {"type": "int"},
    "QORUMDCreator": {"type": "text", "analyzer": "white space"},
    "QORUMDMusicalGenre": {"type": "text"},
    "QORUMDComposer": {"type": "text", "analyzer": "white space"},
    "QORUMDComment": {"type": "text"},
    "QORUMDDurationSecond": {"type": "double"},
    "QORUMDAudioBitRate": {"type": "int"},
    "QORUMDTotalBitRate": {"type": "int"},
    "QORUMDVideoBitRate": {"type": "int"},
    "QORUMDAudioSampleRate": {"type": "int"},
    "QORUMDAudioChannelCount": {"type": "int"},
    "QORUMDISOSpeed": {"type": "int"},
    "QORUMDCodecs": {"type": "text", "analyzer": "white space"},
    "QORUMDDescription": {"type": "text"},
    "QORUMDAcquisitionMake": {"type": "text", "analyzer": "white space"},
    "QORUMDAcquisitionModel": {"type": "text", "analyzer": "white space"},
    "QORUMDExposureTimeString": {"analyzer": "keyword"},
    "QORUMDAperture": {"analyzer": "keyword"},
    "QORUMDResolutionWidthDPI": {"type": "int"},
    "QORUMDResolutionHeightDPI": {"type": "int"},
    "QORUMDMediaTypes": {"analyzer": "keyword"},
    "QORUMDParent": {"analyzer": "keyword", "_all": false},
    "QORUMDExtension": {"analyzer": "keyword", "_all": false},
    "QORUMDTextContent": {"type": "text"},
    "QORUMDKeywords": {},
    "QORUMDFinderLabel": {"type": "int"},
    "QORUMDGroupId": {"analyzer": "keyword"},
    "QORUMDFinderOpenDate": {"type": "int"},
    "QORUMDLogicalSize": {"type": "int"},
    "QORUMDPhysicalSize": {"type": "int"},
    "QORUMDDateAdded": {"type": "int"},
    "QORUMDSearchFileName": {"type": "text", "analyzer": "white space", "preprocess": ["tolower", "ngram"]},
    "QORUMDStarRating": {"analyzer": "keyword"},
    "_QORUMDUserTags": {"type": "text"},
    "QORUMDSpotlightBoost": {"type": "text", "analyzer": "white space"}
  }
})JSON";

namespace {

const char kEventHandlerText[] =
    R"JSON({"lib_path": "/var/packages/Vellis/target/handler/fileindex_event_handler.so"})JSON";

}  // namespace

Json::Value GetFileIndexSettings() { return Json::Value(Json::objectValue); }

Json::Value GetFileIndexMappings() {
  // Parsed on every call so that callers may change their copy freely.
  Json::Value ret;
  VELLIS_THROW_IF(!JsonFromString(ret, kFileIndexMappingsText), kErrInternal,
                  "Cannot parse the mappings template");
  return ret;
}

Json::Value GetFileIndexEventHandler() {
  Json::Value ret;
  VELLIS_THROW_IF(!JsonFromString(ret, kEventHandlerText), kErrInternal,
                  "Cannot parse the event handler");
  return ret;
}

}  // namespace vellis::fileindex::elastic

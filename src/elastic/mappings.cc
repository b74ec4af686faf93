// The file index schema: how the search daemon names a share's index and
// which properties its documents have.
#include <string>

#include "foundation/check.h"
#include "orvex/elastic.h"
#include "orvex/foundation/json.h"

namespace orvex {
namespace fileindex {
namespace elastic {
namespace {

constexpr char kLogSource[] = "elastic_control";

// Kept as text, in the order the properties were defined, and parsed on
// each use: nobody can change the schema of later indexes by editing a
// shared value. "white space" is the daemon's name for its whitespace
// analyzer, blank included.
constexpr char kFileIndexMappings[] = R"({
  "property_id": "KALOMDPath",
  "default": {"type": "string", "analyzer": "kalostandard", "required": false,
              "stored": true, "_all": true},
  "properties": {
    "KALOMDPath": {"analyzer": "keyword", "required": true, "_all": false},
    "KALOMDFSName": {"analyzer": "keyword", "_all": false},
    "KALOMDPrivilege": {"analyzer": "keyword", "_all": false},
    "KALOMDIsDir": {"type": "bool", "_all": false},
    "KALOMDOwnerUserID": {"analyzer": "keyword", "_all": false},
    "KALOMDOwnerGroupID": {"analyzer": "keyword", "_all": false},
    "KALOMDFSSize": {"type": "int"},
    "KALOMDFSContentChangeDate": {"type": "int"},
    "KALOMDAttributeChangeDate": {"type": "int"},
    "KALOMDFSCreationDate": {"type": "int"},
    "KALOMDContentModificationDate": {"type": "int"},
    "KALOMDLastUsedDate": {"type": "int"},
    "KALOMDContentCreationDate": {"type": "int"},
    "KALOMDAuthors": {"type": "text", "analyzer": "white space"},
    "KALOMDTitle": {"type": "text"},
    "KALOMDAlbum": {"type": "text"},
    "KALOMDIdentifier": {"type": "text", "analyzer": "keyword", "_all": false},
    "KALOMDAudioTrackNumber": {"type": "int"},
    "KALOMDRecordingYear": {"type": "int"},
    "KALOMDCreator": {"type": "text", "analyzer": "white space"},
    "KALOMDMusicalGenre": {"type": "text"},
    "KALOMDComposer": {"type": "text", "analyzer": "white space"},
    "KALOMDComment": {"type": "text"},
    "KALOMDDurationSecond": {"type": "double"},
    "KALOMDAudioBitRate": {"type": "int"},
    "KALOMDTotalBitRate": {"type": "int"},
    "KALOMDVideoBitRate": {"type": "int"},
    "KALOMDAudioSampleRate": {"type": "int"},
    "KALOMDAudioChannelCount": {"type": "int"},
    "KALOMDISOSpeed": {"type": "int"},
    "KALOMDCodecs": {"type": "text", "analyzer": "white space"},
    "KALOMDDescription": {"type": "text"},
    "KALOMDAcquisitionMake": {"type": "text", "analyzer": "white space"},
    "KALOMDAcquisitionModel": {"type": "text", "analyzer": "white space"},
    "KALOMDExposureTimeString": {"analyzer": "keyword"},
    "KALOMDAperture": {"analyzer": "keyword"},
    "KALOMDResolutionWidthDPI": {"type": "int"},
    "KALOMDResolutionHeightDPI": {"type": "int"},
    "KALOMDMediaTypes": {"analyzer": "keyword"},
    "KALOMDParent": {"analyzer": "keyword", "_all": false},
    "KALOMDExtension": {"analyzer": "keyword", "_all": false},
    "KALOMDTextContent": {"type": "text"},
    "KALOMDKeywords": {},
    "KALOMDFinderLabel": {"type": "int"},
    "KALOMDGroupId": {"analyzer": "keyword"},
    "KALOMDFinderOpenDate": {"type": "int"},
    "KALOMDLogicalSize": {"type": "int"},
    "KALOMDPhysicalSize": {"type": "int"},
    "KALOMDDateAdded": {"type": "int"},
    "KALOMDSearchFileName": {"type": "text", "analyzer": "white space",
                             "preprocess": ["tolower", "ngram"]},
    "KALOMDStarRating": {"analyzer": "keyword"},
    "_KALOMDUserTags": {"type": "text"},
    "KALOMDSpotlightBoost": {"type": "text", "analyzer": "white space"}
  }
})";

}  // namespace

std::string GetFileIndexID(const std::string& share_name) { return "fileindex_" + share_name; }

Json::Value GetFileIndexMappings() {
  Json::Value ret;
  const std::string mappings = kFileIndexMappings;
  ORVEX_CHECK_AS(!fromString(ret, mappings), "!ret.fromString(mappings)", kErrorSystem,
                 "Cannot parse mappings");
  return ret;
}

}  // namespace elastic
}  // namespace fileindex
}  // namespace orvex

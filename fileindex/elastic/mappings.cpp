#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/request.h"

namespace quivra::fileindex::elastic {
namespace {

/// A listed field holds only what differs from the default. "white space" is the daemon's own name
/// for that analyzer, and the leading underscores differ from the metadata keys' on purpose.
constexpr const char* kMappings = R"({
  "property_id": "KESTOMDPath",
  "default": {"type": "string", "analyzer": "kestostandard",
              "required": false, "stored": true, "_all": true},
  "properties": {
    "KESTOMDPath": {"analyzer": "keyword", "required": true, "_all": false},
    "KESTOMDFSName": {"analyzer": "keyword", "_all": false},
    "KESTOMDPrivilege": {"analyzer": "keyword", "_all": false},
    "KESTOMDIsDir": {"type": "bool", "_all": false},
    "KESTOMDOwnerUserID": {"analyzer": "keyword", "_all": false},
    "KESTOMDOwnerGroupID": {"analyzer": "keyword", "_all": false},
    "KESTOMDFSSize": {"type": "int"},
    "KESTOMDFSContentChangeDate": {"type": "int"},
    "KESTOMDAttributeChangeDate": {"type": "int"},
    "KESTOMDFSCreationDate": {"type": "int"},
    "KESTOMDContentModificationDate": {"type": "int"},
    "KESTOMDLastUsedDate": {"type": "int"},
    "KESTOMDContentCreationDate": {"type": "int"},
    "KESTOMDAuthors": {"type": "text", "analyzer": "white space"},
    "KESTOMDTitle": {"type": "text"},
    "KESTOMDAlbum": {"type": "text"},
    "KESTOMDIdentifier": {"type": "text", "analyzer": "keyword", "_all": false},
    "KESTOMDAudioTrackNumber": {"type": "int"},
    "KESTOMDRecordingYear": {"type": "int"},
    "KESTOMDCreator": {"type": "text", "analyzer": "white space"},
    "KESTOMDMusicalGenre": {"type": "text"},
    "KESTOMDComposer": {"type": "text", "analyzer": "white space"},
    "KESTOMDComment": {"type": "text"},
    "KESTOMDDurationSecond": {"type": "double"},
    "KESTOMDAudioBitRate": {"type": "int"},
    "KESTOMDTotalBitRate": {"type": "int"},
    "KESTOMDVideoBitRate": {"type": "int"},
    "KESTOMDAudioSampleRate": {"type": "int"},
    "KESTOMDAudioChannelCount": {"type": "int"},
    "KESTOMDISOSpeed": {"type": "int"},
    "KESTOMDCodecs": {"type": "text", "analyzer": "white space"},
    "KESTOMDDescription": {"type": "text"},
    "KESTOMDAcquisitionMake": {"type": "text", "analyzer": "white space"},
    "KESTOMDAcquisitionModel": {"type": "text", "analyzer": "white space"},
    "KESTOMDExposureTimeString": {"analyzer": "keyword"},
    "KESTOMDAperture": {"analyzer": "keyword"},
    "KESTOMDResolutionWidthDPI": {"type": "int"},
    "KESTOMDResolutionHeightDPI": {"type": "int"},
    "KESTOMDMediaTypes": {"analyzer": "keyword"},
    "KESTOMDParent": {"analyzer": "keyword", "_all": false},
    "KESTOMDExtension": {"analyzer": "keyword", "_all": false},
    "KESTOMDTextContent": {"type": "text"},
    "KESTOMDKeywords": {},
    "KESTOMDFinderLabel": {"type": "int"},
    "KESTOMDGroupId": {"analyzer": "keyword"},
    "KESTOMDFinderOpenDate": {"type": "int"},
    "KESTOMDLogicalSize": {"type": "int"},
    "KESTOMDPhysicalSize": {"type": "int"},
    "KESTOMDDateAdded": {"type": "int"},
    "KESTOMDSearchFileName": {"type": "text", "analyzer": "white space",
                              "preprocess": ["tolower", "ngram"]},
    "KESTOMDStarRating": {"analyzer": "keyword"},
    "_KESTOMDUserTags": {"type": "text"},
    "KESTOMDSpotlightBoost": {"type": "text", "analyzer": "white space"}
  }
})";

}  // namespace

Json::Value GetFileIndexMappings() {
    Json::Value ret;
    if (!fromString(ret, kMappings)) {
        Fail(unit::kMappings.Here(), "!ret.fromString(mappings)", Error(Error::kSystemCallFailed));
    }
    return ret;
}

}  // namespace quivra::fileindex::elastic

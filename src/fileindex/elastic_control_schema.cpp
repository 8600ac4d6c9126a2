// What every index is made with: the fields of a document and how the engine looks at them.
#define QUARROX_LOG_UNIT "elastic_control"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/elastic_control.h"

namespace quarrox::fileindex::elastic {
namespace {

// A field states only what differs from "default". "_all" false keeps it out of searches that name no field, and
// "preprocess" is what happens to its text before analysis.
const std::string mappings = R"({
	"property_id": "VEXOMDPath",
	"default": {
		"type": "string",
		"analyzer": "vexostandard",
		"required": false,
		"stored": true,
		"_all": true
	},
	"properties": {
		"VEXOMDPath": {"analyzer": "keyword", "required": true, "_all": false},
		"VEXOMDFSName": {"analyzer": "keyword", "_all": false},
		"VEXOMDPrivilege": {"analyzer": "keyword", "_all": false},
		"VEXOMDIsDir": {"type": "bool", "_all": false},
		"VEXOMDOwnerUserID": {"analyzer": "keyword", "_all": false},
		"VEXOMDOwnerGroupID": {"analyzer": "keyword", "_all": false},
		"VEXOMDFSSize": {"type": "int"},
		"VEXOMDFSContentChangeDate": {"type": "int"},
		"VEXOMDAttributeChangeDate": {"type": "int"},
		"VEXOMDFSCreationDate": {"type": "int"},
		"VEXOMDContentModificationDate": {"type": "int"},
		"VEXOMDLastUsedDate": {"type": "int"},
		"VEXOMDContentCreationDate": {"type": "int"},
		"VEXOMDAuthors": {"type": "text", "analyzer": "white space"},
		"VEXOMDTitle": {"type": "text"},
		"VEXOMDAlbum": {"type": "text"},
		"VEXOMDIdentifier": {"type": "text", "analyzer": "keyword", "_all": false},
		"VEXOMDAudioTrackNumber": {"type": "int"},
		"VEXOMDRecordingYear": {"type": "int"},
		"VEXOMDCreator": {"type": "text", "analyzer": "white space"},
		"VEXOMDMusicalGenre": {"type": "text"},
		"VEXOMDComposer": {"type": "text", "analyzer": "white space"},
		"VEXOMDComment": {"type": "text"},
		"VEXOMDDurationSecond": {"type": "double"},
		"VEXOMDAudioBitRate": {"type": "int"},
		"VEXOMDTotalBitRate": {"type": "int"},
		"VEXOMDVideoBitRate": {"type": "int"},
		"VEXOMDAudioSampleRate": {"type": "int"},
		"VEXOMDAudioChannelCount": {"type": "int"},
		"VEXOMDISOSpeed": {"type": "int"},
		"VEXOMDCodecs": {"type": "text", "analyzer": "white space"},
		"VEXOMDDescription": {"type": "text"},
		"VEXOMDAcquisitionMake": {"type": "text", "analyzer": "white space"},
		"VEXOMDAcquisitionModel": {"type": "text", "analyzer": "white space"},
		"VEXOMDExposureTimeString": {"analyzer": "keyword"},
		"VEXOMDAperture": {"analyzer": "keyword"},
		"VEXOMDResolutionWidthDPI": {"type": "int"},
		"VEXOMDResolutionHeightDPI": {"type": "int"},
		"VEXOMDMediaTypes": {"analyzer": "keyword"},
		"VEXOMDParent": {"analyzer": "keyword", "_all": false},
		"VEXOMDExtension": {"analyzer": "keyword", "_all": false},
		"VEXOMDTextContent": {"type": "text"},
		"VEXOMDKeywords": {},
		"VEXOMDFinderLabel": {"type": "int"},
		"VEXOMDGroupId": {"analyzer": "keyword"},
		"VEXOMDFinderOpenDate": {"type": "int"},
		"VEXOMDLogicalSize": {"type": "int"},
		"VEXOMDPhysicalSize": {"type": "int"},
		"VEXOMDDateAdded": {"type": "int"},
		"VEXOMDSearchFileName": {"type": "text", "analyzer": "white space", "preprocess": ["tolower", "ngram"]},
		"VEXOMDSearchAncestor": {"type": "text", "analyzer": "white space escaped", "_all": false,
			"preprocess": ["list_ancestor"]},
		"VEXOMDStarRating": {"analyzer": "keyword"},
		"_VEXOMDUserTags": {"type": "text"},
		"VEXOMDSpotlightBoost": {"type": "text", "analyzer": "white space"},
		"VEXOMDIsEncrypted": {"type": "bool", "_all": false}
	}
})";

const std::string event_handler = R"({
	"lib_path": "/var/packages/Quarrox/target/handler/fileindex_event_handler.so"
})";

}  // namespace

std::string GetFileIndexID(const std::string& share) {
  return "fileindex_" + share;
}

Json::Value GetFileIndexSettings() {
  return Json::Value(Json::objectValue);
}

Json::Value GetFileIndexMappings() {
  Json::Value ret;
  if (!fromString(ret, mappings)) QUARROX_THROW("!ret.fromString(mappings)", kErrSystem, "");
  return ret;
}

Json::Value GetFileIndexEventHandler() {
  Json::Value ret;
  if (!fromString(ret, event_handler)) QUARROX_THROW("!ret.fromString(event_handler)", kErrSystem, "");
  return ret;
}

}  // namespace quarrox::fileindex::elastic

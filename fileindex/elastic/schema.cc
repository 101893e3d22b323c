#include "fileindex/elastic/schema.h"

#include "common/error.h"
#include "common/json_util.h"
#include "common/log.h"
#include "common/sys.h"

namespace corvlumex {
namespace fileindex {
namespace elastic {

// One entry per field, holding only what differs from "default". The daemon
// must not depend on the member order, but the text keeps a fixed one so
// that two builds send the same mappings.
const char kFileIndexMappingsText[] = R"json({
	"property_id": "CORVMDPath",
	"default": {
		"type": "string",
		"analyzer": "corvstandard",
		"required": false,
		"stored": true,
		"_all": true
	},
	"properties": {
		"CORVMDPath": {
			"analyzer": "keyword",
			"required": true,
			"_all": false
		},
		"CORVMDFSName": {
			"analyzer": "keyword",
			"_all": false
		},
		"CORVMDPrivilege": {
			"analyzer": "keyword",
			"_all": false
		},
		"CORVMDIsDir": {
			"type": "bool",
			"_all": false
		},
		"CORVMDOwnerUserID": {
			"analyzer": "keyword",
			"_all": false
		},
		"CORVMDOwnerGroupID": {
			"analyzer": "keyword",
			"_all": false
		},
		"CORVMDFSSize": {
			"type": "int"
		},
		"CORVMDFSContentChangeDate": {
			"type": "int"
		},
		"CORVMDAttributeChangeDate": {
			"type": "int"
		},
		"CORVMDFSCreationDate": {
			"type": "int"
		},
		"CORVMDContentModificationDate": {
			"type": "int"
		},
		"CORVMDLastUsedDate": {
			"type": "int"
		},
		"CORVMDContentCreationDate": {
			"type": "int"
		},
		"CORVMDAuthors": {
			"type": "text",
			"analyzer": "white space"
		},
		"CORVMDTitle": {
			"type": "text"
		},
		"CORVMDAlbum": {
			"type": "text"
		},
		"CORVMDIdentifier": {
			"type": "text",
			"analyzer": "keyword",
			"_all": false
		},
		"CORVMDAudioTrackNumber": {
			"type": "int"
		},
		"CORVMDRecordingYear": {
			"type": "int"
		},
		"CORVMDCreator": {
			"type": "text",
			"analyzer": "white space"
		},
		"CORVMDMusicalGenre": {
			"type": "text"
		},
		"CORVMDComposer": {
			"type": "text",
			"analyzer": "white space"
		},
		"CORVMDComment": {
			"type": "text"
		},
		"CORVMDDurationSecond": {
			"type": "double"
		},
		"CORVMDAudioBitRate": {
			"type": "int"
		},
		"CORVMDTotalBitRate": {
			"type": "int"
		},
		"CORVMDVideoBitRate": {
			"type": "int"
		},
		"CORVMDAudioSampleRate": {
			"type": "int"
		},
		"CORVMDAudioChannelCount": {
			"type": "int"
		},
		"CORVMDISOSpeed": {
			"type": "int"
		},
		"CORVMDCodecs": {
			"type": "text",
			"analyzer": "white space"
		},
		"CORVMDDescription": {
			"type": "text"
		},
		"CORVMDAcquisitionMake": {
			"type": "text",
			"analyzer": "white space"
		},
		"CORVMDAcquisitionModel": {
			"type": "text",
			"analyzer": "white space"
		},
		"CORVMDExposureTimeString": {
			"analyzer": "keyword"
		},
		"CORVMDAperture": {
			"analyzer": "keyword"
		},
		"CORVMDResolutionWidthDPI": {
			"type": "int"
		},
		"CORVMDResolutionHeightDPI": {
			"type": "int"
		},
		"CORVMDMediaTypes": {
			"analyzer": "keyword"
		},
		"CORVMDParent": {
			"analyzer": "keyword",
			"_all": false
		},
		"CORVMDExtension": {
			"analyzer": "keyword",
			"_all": false
		},
		"CORVMDTextContent": {
			"type": "text"
		},
		"CORVMDKeywords": {},
		"CORVMDFinderLabel": {
			"type": "int"
		},
		"CORVMDGroupId": {
			"analyzer": "keyword"
		},
		"CORVMDFinderOpenDate": {
			"type": "int"
		},
		"CORVMDLogicalSize": {
			"type": "int"
		},
		"CORVMDPhysicalSize": {
			"type": "int"
		},
		"CORVMDDateAdded": {
			"type": "int"
		},
		"CORVMDSearchFileName": {
			"type": "text",
			"analyzer": "white space",
			"preprocess": ["tolower", "ngram"]
		},
		"CORVMDStarRating": {
			"analyzer": "keyword"
		},
		"_CORVMDUserTags": {
			"type": "text"
		},
		"CORVMDSpotlightBoost": {
			"type": "text",
			"analyzer": "white space"
		},
		"CORVMDFSFileID": {
			"analyzer": "keyword",
			"_all": false
		},
		"CORVMDExtractionFailed": {
			"type": "bool",
			"_all": false
		},
		"CORVMDExtractionError": {
			"analyzer": "keyword",
			"_all": false
		},
		"CORVMDPixelWidth": {
			"type": "int"
		},
		"CORVMDPixelHeight": {
			"type": "int"
		}
	}
})json";

const char kFileIndexEventHandlerText[] = R"json({
	"lib_path": "/var/packages/CorvLumex/target/handler/fileindex_event_handler.so"
})json";

Json::Value GetFileIndexSettings() { return Json::Value(Json::objectValue); }

Json::Value GetFileIndexMappings() {
  Json::Value ret;
  const char* mappings = kFileIndexMappingsText;
  CORV_CHECK_THROW_TEXT(!JsonFromString(ret, mappings), "!ret.fromString(mappings)", kErrorSystem);
  return ret;
}

Json::Value GetFileIndexEventHandler() {
  Json::Value ret;
  const char* event_handler = kFileIndexEventHandlerText;
  CORV_CHECK_THROW_TEXT(!JsonFromString(ret, event_handler), "!ret.fromString(event_handler)", kErrorSystem);
  // The plug-in lives under the package's target, which a sandbox relocates.
  ret["lib_path"] = SysPath(ret["lib_path"].asString());
  return ret;
}

}  // namespace elastic
}  // namespace fileindex
}  // namespace corvlumex

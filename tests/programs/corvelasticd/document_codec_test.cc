// The stored form of documents: every value comes back exactly as sent (JSON
// types included), the shortcuts for repeated names and parent folders
// resolve against the right key, old JSON records still read, and damaged
// records never crash.
#include <gtest/gtest.h>

#include <sqlite3.h>

#include "common/json_util.h"
#include "programs/corvelasticd/document_codec.h"
#include "programs/corvelasticd/index_schema.h"
#include "tests/programs/corvelasticd/daemon_harness.h"

namespace corvlumex {
namespace elasticd {
namespace {

constexpr const char* kKey = "/v/share/Reports/Quarterly Report.pdf";

class DocumentCodecTest : public ::testing::Test {
 protected:
  DocumentCodecTest() : schema_(IndexSchema::FromMappings(elasticd_test::LibraryMappings())) {}

  Json::Value RoundTrip(const Json::Value& document, const std::string& key = kKey) {
    return DecodeDocument(schema_, key, EncodeDocument(schema_, key, document));
  }

  // The field as SQL sees it through corv_field().
  std::string SqlField(const std::string& record, const std::string& field) {
    sqlite3* db = nullptr;
    EXPECT_EQ(sqlite3_open(":memory:", &db), SQLITE_OK);
    RegisterDocumentFunctions(db);
    sqlite3_stmt* stmt = nullptr;
    EXPECT_EQ(sqlite3_prepare_v2(db, "SELECT typeof(v) || ':' || quote(v) FROM (SELECT corv_field(?, ?, ?) AS v)", -1, &stmt, nullptr),
              SQLITE_OK);
    sqlite3_bind_text(stmt, 1, kKey, -1, SQLITE_STATIC);
    sqlite3_bind_blob(stmt, 2, record.data(), static_cast<int>(record.size()), SQLITE_STATIC);
    sqlite3_bind_int(stmt, 3, schema_.Find(field)->code);
    EXPECT_EQ(sqlite3_step(stmt), SQLITE_ROW);
    const std::string out = reinterpret_cast<const char*>(sqlite3_column_text(stmt, 0));
    sqlite3_finalize(stmt);
    sqlite3_close(db);
    return out;
  }

  IndexSchema schema_;
};

TEST_F(DocumentCodecTest, EveryJsonTypeComesBackExactly) {
  const Json::Value document = elasticd_test::Data(R"({
      "CORVMDPath": "/v/share/Reports/Quarterly Report.pdf",
      "CORVMDFSSize": 9007199254740993, "CORVMDFSContentChangeDate": -1700000000,
      "CORVMDDurationSecond": 12.25, "CORVMDIsDir": false, "CORVMDTitle": null,
      "CORVMDAuthors": ["Ann", "Bob", 3, true], "CORVMDKeywords": "",
      "Unmapped": {"nested": [1, {"deep": "x"}]}, "big": 18446744073709551615,
      "~tilde": 1.5e300})");
  const Json::Value back = RoundTrip(document);
  EXPECT_EQ(back, document);
  EXPECT_EQ(JsonToString(back), JsonToString(document));
  EXPECT_TRUE(back["big"].isUInt64() && !back["big"].isInt64());
  EXPECT_EQ(back["CORVMDFSSize"].type(), document["CORVMDFSSize"].type());
  EXPECT_EQ(back["CORVMDDurationSecond"].type(), Json::realValue);
  // Text with NUL bytes and invalid UTF-8 is kept.
  const std::string text("a\0b\xFF", 4);
  Json::Value binary;
  binary["CORVMDTitle"] = Json::Value(text.data(), text.data() + text.size());
  EXPECT_EQ(RoundTrip(binary)["CORVMDTitle"].asString(), text);
}

TEST_F(DocumentCodecTest, RepeatedNamesAndTheKeysOwnParentFolderAreStoredOnce) {
  const Json::Value document = elasticd_test::Data(R"({"CORVMDPath": "/v/share/Reports/Quarterly Report.pdf",
      "CORVMDParent": "/v/share/Reports", "CORVMDFSName": "Quarterly Report.pdf",
      "CORVMDSearchFileName": "Quarterly Report.pdf"})");
  const std::string record = EncodeDocument(schema_, kKey, document);
  // Each text at most once, and never the key itself.
  EXPECT_EQ(record.find("/v/share"), std::string::npos);
  EXPECT_EQ(record.find("Quarterly Report.pdf"), record.rfind("Quarterly Report.pdf"));
  EXPECT_EQ(DecodeDocument(schema_, kKey, record), document);
  EXPECT_EQ(SqlField(record, "CORVMDParent"), "text:'/v/share/Reports'");
  EXPECT_EQ(SqlField(record, "CORVMDSearchFileName"), "text:'Quarterly Report.pdf'");
  // The parent of a key without a folder, and a parent not the key's own.
  const Json::Value plain = elasticd_test::Data(R"({"CORVMDPath": "plain-key", "CORVMDParent": ""})");
  EXPECT_EQ(RoundTrip(plain, "plain-key"), plain);
  const Json::Value other = elasticd_test::Data(R"({"CORVMDPath": "/v/share/Reports/Quarterly Report.pdf", "CORVMDParent": "/v/share"})");
  EXPECT_EQ(RoundTrip(other), other);
}

TEST_F(DocumentCodecTest, SqlSeesNumbersBoolsArraysAndAbsentFields) {
  const std::string record = EncodeDocument(schema_, kKey, elasticd_test::Data(R"({
      "CORVMDFSSize": 5000, "CORVMDDurationSecond": 2.5, "CORVMDIsDir": true, "CORVMDAuthors": ["Ann", "Bob"]})"));
  EXPECT_EQ(SqlField(record, "CORVMDFSSize"), "integer:5000");
  EXPECT_EQ(SqlField(record, "CORVMDDurationSecond"), "real:2.5");
  EXPECT_EQ(SqlField(record, "CORVMDIsDir"), "integer:1");
  EXPECT_EQ(SqlField(record, "CORVMDAuthors"), "text:'[\"Ann\",\"Bob\"]'");
  EXPECT_EQ(SqlField(record, "CORVMDTitle"), "null:NULL");
}

TEST_F(DocumentCodecTest, RecordsOfEarlierVersionsStillRead) {
  // JSON text: mapped fields under their number, others behind '~'.
  const int size_code = schema_.Find("CORVMDFSSize")->code;
  const std::string record = "{\"" + std::to_string(size_code) + "\":42,\"~extra\":\"x\"}";
  const Json::Value back = DecodeDocument(schema_, kKey, record);
  EXPECT_EQ(back["CORVMDFSSize"].asInt(), 42);
  EXPECT_EQ(back["extra"].asString(), "x");
  EXPECT_EQ(back["CORVMDPath"].asString(), kKey);
  EXPECT_EQ(SqlField(record, "CORVMDFSSize"), "integer:42");
}

TEST_F(DocumentCodecTest, DamagedRecordsGiveWhatCanBeReadWithoutCrashing) {
  const Json::Value document = elasticd_test::Data(R"({"CORVMDFSName": "Quarterly Report.pdf", "CORVMDAuthors": ["Ann"]})");
  const std::string record = EncodeDocument(schema_, kKey, document);
  for (size_t length = 0; length < record.size(); ++length) {
    const Json::Value back = DecodeDocument(schema_, kKey, record.substr(0, length));
    EXPECT_EQ(back["CORVMDPath"].asString(), kKey);
    DecodeField(kKey, record.substr(0, length), schema_.Find("CORVMDFSName")->code);
  }
  std::string bad = record;
  for (char& byte : bad) {
    if (&byte != &bad[0]) byte = '\xFF';  // endless varints, unknown types
  }
  EXPECT_EQ(DecodeDocument(schema_, kKey, bad).size(), 1u);
}

}  // namespace
}  // namespace elasticd
}  // namespace corvlumex

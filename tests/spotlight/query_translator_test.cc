// The query strings Samba's Spotlight back end writes, as its own parser
// tests expect them (source3/rpc_server/mdssvc/test_mdsparser_es.c), with the
// field names of our mappings file, and what corvelasticd is asked for each.
#include "programs/corvspotlightd/query_translator.h"

#include <gtest/gtest.h>

#include "common/json_util.h"
#include "fileindex/elastic/schema.h"

namespace corvlumex {
namespace spotlightd {
namespace {

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(JsonFromString(value, text)) << text;
  return value;
}

const FieldTable& OurFields() {
  static const FieldTable table = FieldTable::FromMappings(fileindex::elastic::GetFileIndexMappings());
  return table;
}

const std::vector<std::string> kDefaultFields = {"CORVMDFSName", "CORVMDTextContent"};

// Words without a field: a fragment of the name, or a word of the text.
std::string Anywhere(const std::string& word, const std::string& content_clause) {
  return R"({"bool": {"should": [{"match": {"CORVMDSearchFileName": ")" + word + R"("}}, )" + content_clause + "]}}";
}

TEST(QueryTranslatorTest, SambasParserOutputBecomesOurSearchLanguage) {
  const std::string scope = R"({"prefix": {"CORVMDPath": "/foo/bar/"}})";
  const std::string date = "2001-01-01T00:00:01Z";
  const struct {
    const char* spotlight;  // what the Finder or mdsearch sent, for the reader
    std::string query;      // what Samba writes (JSON-decoded)
    std::string expected;   // the clause, before the share scope
  } cases[] = {
      {R"(*=="samba")", "samba", Anywhere("samba", R"({"match": {"CORVMDTextContent": "samba"}})")},
      {R"(kMDItemTextContent=="samba")", "CORVMDTextContent:samba", R"({"match": {"CORVMDTextContent": "samba"}})"},
      {R"(_kMDItemGroupId=="11")", R"(CORVMDMediaTypes:(application\/pdf))",
       R"({"term": {"CORVMDMediaTypes": "application/pdf"}})"},
      {R"(kMDItemContentType=="public.content")",
       R"(CORVMDMediaTypes:(message\/rfc822 application\/pdf image\/* text\/*))",
       R"({"bool": {"should": [{"term": {"CORVMDMediaTypes": "message/rfc822"}},
           {"term": {"CORVMDMediaTypes": "application/pdf"}}, {"prefix": {"CORVMDMediaTypes": "image/"}},
           {"prefix": {"CORVMDMediaTypes": "text/"}}]}})"},
      {R"(kMDItemFSContentChangeDate==$time.iso(2018-10-01T10:00:00Z))",
       R"(CORVMDFSContentChangeDate:2018\-10\-01T10\:00\:00Z)",
       R"({"range": {"CORVMDFSContentChangeDate": {"gte": "2018-10-01T10:00:00Z", "lte": "2018-10-01T10:00:00Z"}}})"},
      {R"(kMDItemFSName=="samba*")", "CORVMDFSName:samba*", R"({"prefix": {"CORVMDFSName": "samba"}})"},
      {R"(kMDItemFSName=="*amb*")", "CORVMDFSName:*amb*", R"({"match": {"CORVMDSearchFileName": "amb"}})"},
      {R"(kMDItemDisplayName=="Samba")", "CORVMDFSName:Samba", R"({"term": {"CORVMDFSName": "Samba"}})"},
      {R"(kMDItemFSName=="a\*b")", R"(CORVMDFSName:a\*b)", R"({"term": {"CORVMDFSName": "a*b"}})"},
      {R"(kMDItemFSOwnerUserID=="0")", "CORVMDOwnerUserID:0", R"({"term": {"CORVMDOwnerUserID": "0"}})"},
      {R"(kMDItemFSSize=="1")", "CORVMDFSSize:1", R"({"range": {"CORVMDFSSize": {"gte": 1, "lte": 1}}})"},
      {R"(kMDItemPath=="/foo/bar")", R"(CORVMDPath:\/foo\/bar)", R"({"term": {"CORVMDPath": "/foo/bar"}})"},
      {R"(kMDItemAuthors=="Chouka")", "CORVMDAuthors:Chouka", R"({"match": {"CORVMDAuthors": "Chouka"}})"},
      {R"(kMDItemAlbum=="Red Roses for Me")", R"(CORVMDAlbum:Red\ Roses\ for\ Me)",
       R"({"match_phrase": {"CORVMDAlbum": "Red Roses for Me"}})"},
      {R"(kMDItemTitle phrase)", R"(CORVMDTitle:"harbour lights")",
       R"({"match_phrase": {"CORVMDTitle": "harbour lights"}})"},
      {R"(*!="samba")", "(NOT samba)",
       R"({"bool": {"must_not": [)" + Anywhere("samba", R"({"match": {"CORVMDTextContent": "samba"}})") + "]}}"},
      {R"(kMDItemFSSize!="1")", "(NOT CORVMDFSSize:1)",
       R"({"bool": {"must_not": [{"range": {"CORVMDFSSize": {"gte": 1, "lte": 1}}}]}})"},
      {R"(kMDItemFSSize>"1")", "CORVMDFSSize:{1 TO *}", R"({"range": {"CORVMDFSSize": {"gt": 1}}})"},
      {R"(kMDItemFSSize<"1")", "CORVMDFSSize:{* TO 1}", R"({"range": {"CORVMDFSSize": {"lt": 1}}})"},
      {R"(kMDItemPixelWidth>"1000")", "CORVMDPixelWidth:{1000 TO *}", R"({"range": {"CORVMDPixelWidth": {"gt": 1000}}})"},
      {R"(kMDItemFSCreationDate>"1")", R"(CORVMDFSCreationDate:{2001\-01\-01T00\:00\:01Z TO *})",
       R"({"range": {"CORVMDFSCreationDate": {"gt": ")" + date + R"("}}})"},
      {R"(kMDItemFSCreationDate<"1")", R"(CORVMDFSCreationDate:{* TO 2001\-01\-01T00\:00\:01Z})",
       R"({"range": {"CORVMDFSCreationDate": {"lt": ")" + date + R"("}}})"},
      {R"(kMDItemFSName=="Samba"||kMDItemTextContent=="Samba")", "CORVMDFSName:Samba OR CORVMDTextContent:Samba",
       R"({"bool": {"should": [{"term": {"CORVMDFSName": "Samba"}}, {"match": {"CORVMDTextContent": "Samba"}}]}})"},
      {R"(kMDItemFSName=="Samba"&&kMDItemTextContent=="Samba")",
       "(CORVMDFSName:Samba) AND (CORVMDTextContent:Samba)",
       R"({"bool": {"must": [{"term": {"CORVMDFSName": "Samba"}}, {"match": {"CORVMDTextContent": "Samba"}}]}})"},
      {R"(InRange(kMDItemFSCreationDate,1,2))",
       R"(CORVMDFSCreationDate:[2001\-01\-01T00\:00\:01Z TO 2001\-01\-01T00\:00\:02Z])",
       R"({"range": {"CORVMDFSCreationDate": {"gte": ")" + date + R"(", "lte": "2001-01-01T00:00:02Z"}}})"},
      {R"(InRange(kMDItemFSSize,1,2))", "CORVMDFSSize:[1 TO 2]",
       R"({"range": {"CORVMDFSSize": {"gte": 1, "lte": 2}}})"},
      {R"(*=="port*" (Finder's name search))", "port*",
       Anywhere("port", R"({"prefix": {"CORVMDTextContent": "port"}})")},
      {R"(kMDItemFSName=="*")", "CORVMDFSName:*", R"({"match_all": {}})"},
  };
  for (const auto& test : cases) {
    // Samba 4.17: the share scope inside the string.
    const TranslatedQuery old_shape = TranslateQueryString(
        "(" + test.query + ") AND path.real.fulltext:\"/foo/bar\"", kDefaultFields, OurFields());
    EXPECT_EQ(old_shape.clause, Parse(R"({"bool": {"must": [)" + test.expected + ", " + scope + "]}}"))
        << test.spotlight << "\n" << JsonToString(old_shape.clause);
    EXPECT_EQ(old_shape.scopes, std::vector<std::string>{"/foo/bar"}) << test.spotlight;
    // Later Samba: the string alone.
    const TranslatedQuery new_shape = TranslateQueryString(test.query, kDefaultFields, OurFields());
    EXPECT_EQ(new_shape.clause, Parse(test.expected)) << test.spotlight << "\n" << JsonToString(new_shape.clause);
    EXPECT_TRUE(new_shape.scopes.empty());
  }
}

TEST(QueryTranslatorTest, BackslashesEscapeFieldNames) {
  const FieldTable fields = FieldTable::FromMappings(Parse(R"({"property_id": "path",
      "default": {"type": "string", "analyzer": "corvstandard"},
      "properties": {"path": {"analyzer": "keyword"}, "meta.raw.xmpDM:duration": {"type": "double"},
                     "meta.raw.Image Height": {"type": "int"}, "a b:c": {}}})"));
  EXPECT_EQ(TranslateQueryString(R"(meta.raw.xmpDM\:duration:1)", {}, fields).clause,
            Parse(R"({"range": {"meta.raw.xmpDM:duration": {"gte": 1, "lte": 1}}})"));
  EXPECT_EQ(TranslateQueryString(R"(meta.raw.Image\ Height:[1 TO 2])", {}, fields).clause,
            Parse(R"({"range": {"meta.raw.Image Height": {"gte": 1, "lte": 2}}})"));
  EXPECT_EQ(TranslateQueryString(R"(a\ b\:c:x\-y)", {}, fields).clause, Parse(R"({"match": {"a b:c": "x-y"}})"));
}

TEST(QueryTranslatorTest, FaultsNameWhatIsWrong) {
  const std::string deep = std::string(40, '(') + "x" + std::string(40, ')');
  const struct {
    std::string query;
    const char* named;
  } cases[] = {
      {"CORVMDFSName:fo*o", "inside"},
      {"CORVMDFSName:fo?", "\"?\""},
      {"nosuchfield:x", "unknown field \"nosuchfield\""},
      {"(samba", "\")\" expected"},
      {"samba)", "unexpected \")\""},
      {"samba AND", "missing"},
      {"CORVMDFSSize:[1 TO", "range bound is missing"},
      {"CORVMDFSSize:[1 2]", "\"TO\" expected"},
      {"CORVMDTextContent:[1 TO 2]", "no ranges"},
      {"CORVMDFSSize:12*", "no wildcards"},
      {"CORVMDMediaTypes:*pdf", "cannot be searched for values ending"},
      {"CORVMDFSName:", "value is missing"},
      {"samba\\", "backslash ends"},
      {"\"unclosed", "no closing quote"},
      {"CORVMDFSName:()", "empty list"},
      {deep, "nested deeper than 32"},
  };
  for (const auto& test : cases) {
    try {
      TranslateQueryString(test.query, kDefaultFields, OurFields());
      ADD_FAILURE() << test.query << " was accepted";
    } catch (const QueryStringError& error) {
      EXPECT_NE(std::string(error.what()).find(test.named), std::string::npos) << test.query << ": " << error.what();
    }
  }
}

}  // namespace
}  // namespace spotlightd
}  // namespace corvlumex

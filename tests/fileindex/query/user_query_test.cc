#include "fileindex/query/user_query.h"

#include <gtest/gtest.h>

#include <string>

namespace corvlumex {
namespace fileindex {
namespace {

// Compact JSON with the keys in the JSON library's order, for comparison.
std::string Compact(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  return Json::writeString(builder, value);
}

std::string Parsed(const std::string& text) {
  constexpr time_t kNow = 1767225600;  // 2026-01-01T00:00:00Z
  return Compact(UserQueryToSearch(text, kNow)["qsl"]);
}

TEST(UserQueryTest, WhatPeopleTypeBecomesTheDaemonsClauses) {
  const struct {
    const char* text;
    const char* qsl;
  } cases[] = {
      {"", R"({"match_all":{}})"},
      {"   ", R"({"match_all":{}})"},
      // Plain words form one "match" (all must match), ranked together.
      {"saffron rice", R"({"match":{"_all":"saffron rice"}})"},
      {"saffron AND rice", R"({"match":{"_all":"saffron rice"}})"},
      {"e-mail C++ foo_bar", R"({"match":{"_all":"e-mail C++ foo_bar"}})"},
      {"\"copyright holder\"", R"({"match_phrase":{"_all":"copyright holder"}})"},
      {"budg*", R"({"prefix":{"_all":"budg"}})"},
      {"\"annual bud\"*", R"({"prefix":{"_all":"annual bud"}})"},
      // OR binds tighter than the blank; lower-case "or" is a word.
      {"tea OR coffee", R"({"bool":{"should":[{"match":{"_all":"tea"}},{"match":{"_all":"coffee"}}]}})"},
      {"cake tea OR coffee",
       R"({"bool":{"must":[{"match":{"_all":"cake"}},{"bool":{"should":[{"match":{"_all":"tea"}},{"match":{"_all":"coffee"}}]}}]}})"},
      {"tea or coffee", R"({"match":{"_all":"tea or coffee"}})"},
      {"-draft report", R"({"bool":{"must":[{"match":{"_all":"report"}}],"must_not":[{"match":{"_all":"draft"}}]}})"},
      {"report NOT draft", R"({"bool":{"must":[{"match":{"_all":"report"}}],"must_not":[{"match":{"_all":"draft"}}]}})"},
      {"-\"old draft\"", R"({"bool":{"must_not":[{"match_phrase":{"_all":"old draft"}}]}})"},
      {"report -(tea OR coffee)",
       R"({"bool":{"must":[{"match":{"_all":"report"}}],"must_not":[{"bool":{"should":[{"match":{"_all":"tea"}},{"match":{"_all":"coffee"}}]}}]}})"},
      {"tea OR -coffee", R"({"bool":{"should":[{"match":{"_all":"tea"}},{"bool":{"must_not":[{"match":{"_all":"coffee"}}]}}]}})"},
      {"(tea OR coffee) (cake)",
       R"({"bool":{"must":[{"bool":{"should":[{"match":{"_all":"tea"}},{"match":{"_all":"coffee"}}]}},{"match":{"_all":"cake"}}]}})"},
      {"a - b", R"({"match":{"_all":"a - b"}})"},
      {"report(1).pdf", R"({"match":{"_all":"report(1).pdf"}})"},
      {"http://example.org", R"({"match":{"_all":"http://example.org"}})"},
      // Filters.
      {"name:rep", R"({"match":{"CORVMDSearchFileName":"rep"}})"},
      {"NAME:\"annual report\"", R"({"match":{"CORVMDSearchFileName":"annual report"}})"},
      {"ext:.PDF", R"({"term":{"CORVMDExtension":"PDF"}})"},
      {"ext:jpg,png", R"({"terms":{"CORVMDExtension":["jpg","png"]}})"},
      {"type:folder", R"({"term":{"CORVMDIsDir":true}})"},
      {"in:/volume1/docs/", R"({"prefix":{"CORVMDPath":"/volume1/docs/"}})"},
      {"path:\"/volume1/my docs\"", R"({"prefix":{"CORVMDPath":"/volume1/my docs/"}})"},
      {"size:>10M", R"({"range":{"CORVMDFSSize":{"gt":10485760}}})"},
      {"size:<=1.5k", R"({"range":{"CORVMDFSSize":{"lte":1536}}})"},
      {"size:4096", R"({"term":{"CORVMDFSSize":4096}})"},
      {"size:>2MiB", R"({"range":{"CORVMDFSSize":{"gt":2097152}}})"},
      {"modified:>2026-01-01", R"({"range":{"CORVMDFSContentChangeDate":{"gte":1767312000}}})"},
      {"modified:<2026-01-01", R"({"range":{"CORVMDFSContentChangeDate":{"lt":1767225600}}})"},
      {"modified:2026-01-01", R"({"range":{"CORVMDFSContentChangeDate":{"gte":1767225600,"lt":1767312000}}})"},
      {"modified:<7d", R"({"range":{"CORVMDFSContentChangeDate":{"gt":1766620800}}})"},
      {"modified:>1w", R"({"range":{"CORVMDFSContentChangeDate":{"lt":1766620800}}})"},
      {"modified:<=12h", R"({"range":{"CORVMDFSContentChangeDate":{"gte":1767182400}}})"},
      {"owner:0", R"({"term":{"CORVMDOwnerUserID":"0"}})"},
      {"owner:root", R"({"term":{"CORVMDOwnerUserID":"0"}})"},
      {"rice -ext:pdf size:<1M",
       R"({"bool":{"must":[{"match":{"_all":"rice"}},{"range":{"CORVMDFSSize":{"lt":1048576}}}],"must_not":[{"term":{"CORVMDExtension":"pdf"}}]}})"},
  };
  for (const auto& c : cases) EXPECT_EQ(Parsed(c.text), c.qsl) << c.text;
}

TEST(UserQueryTest, CategoriesUseTheirExtensionLists) {
  const Json::Value photo = UserQueryToSearch("type:photo")["qsl"]["terms"]["CORVMDExtension"];
  ASSERT_TRUE(photo.isArray());
  bool has_jpg = false;
  for (const Json::Value& ext : photo) has_jpg = has_jpg || ext.asString() == "jpg";
  EXPECT_TRUE(has_jpg);
  EXPECT_EQ(UserQueryToSearch("TYPE:Document")["qsl"]["terms"]["CORVMDExtension"].size(),
            UserQueryToSearch("type:document")["qsl"]["terms"]["CORVMDExtension"].size());
}

TEST(UserQueryTest, AQueryThatCannotBeParsedSaysWhereAndWhy) {
  const struct {
    const char* text;
    size_t position;
    const char* reason_part;
  } cases[] = {
      {"\"copyright holder", 0, "never closed"},
      {"a (b OR c", 2, "never closed"},
      {"a b)", 3, "closes no"},
      {")", 0, "closes no"},
      {"a ()", 2, "hold nothing"},
      {"tea OR", 4, "on its right"},
      {"OR tea", 0, "on its left"},
      {"tea OR OR coffee", 4, "on its right"},
      {"a AND", 2, "on its right"},
      {"AND a", 0, "on its left"},
      {"report NOT", 7, "NOT"},
      {"* x", 0, "must end a word"},
      {"\"\"", 0, "hold no words"},
      {"name:", 5, "needs a value"},
      {"type:image", 5, "document, audio, video, photo"},
      {"size:>big", 5, "size:>10M"},
      {"modified:>yesterday", 9, "modified:<7d"},
      {"modified:2026-13-45", 9, "date"},
      {"in:docs", 3, "full path"},
      {"owner:no-such-user-here", 6, "no user named"},
      {"ext:pdf,,doc", 4, "ext:pdf"},
  };
  for (const auto& c : cases) {
    try {
      UserQueryToSearch(c.text);
      ADD_FAILURE() << "no error for " << c.text;
    } catch (const UserQuerySyntaxError& error) {
      EXPECT_EQ(error.position(), c.position) << c.text << ": " << error.what();
      EXPECT_NE(error.reason().find(c.reason_part), std::string::npos) << c.text << ": " << error.what();
      EXPECT_NE(std::string(error.what()).find("character " + std::to_string(c.position + 1)), std::string::npos)
          << error.what();
    }
  }
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex

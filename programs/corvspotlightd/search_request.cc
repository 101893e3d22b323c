#include "programs/corvspotlightd/search_request.h"

#include <json/json.h>

#include <memory>

namespace corvlumex {
namespace spotlightd {
namespace {

// Deeper JSON than any request Samba writes is refused by the reader itself,
// before it can use up the stack.
constexpr int kJsonDepthLimit = 16;

[[noreturn]] void Bad(const std::string& what) { throw SearchRequestError(what); }

const Json::Value& Member(const Json::Value& object, const char* name, const std::string& where) {
  if (!object.isObject() || !object.isMember(name)) Bad(where + " has no \"" + name + "\"");
  return object[name];
}

int PageNumber(const Json::Value& body, const char* name, int fallback, int max) {
  if (!body.isMember(name)) return fallback;
  const Json::Value& value = body[name];
  if (!value.isInt() || value.asInt() < 0 || value.asInt() > max) {
    Bad(std::string("\"") + name + "\" must be an integer from 0 to " + std::to_string(max));
  }
  return value.asInt();
}

std::string QueryText(const Json::Value& query_string) {
  const Json::Value& query = Member(query_string, "query", "\"query_string\"");
  if (!query.isString()) Bad("\"query_string.query\" must be a string");
  return query.asString();
}

// The one-element list Samba writes (or a single clause).
const Json::Value& OnlyClause(const Json::Value& list, const std::string& where) {
  if (list.isObject()) return list;
  if (!list.isArray() || list.size() != 1) Bad(where + " must hold exactly one clause");
  return list[0];
}

void ReadBoolShape(const Json::Value& bool_query, SearchRequest* request) {
  for (const std::string& name : bool_query.getMemberNames()) {
    if (name != "filter" && name != "must") Bad("\"bool." + name + "\" is not supported (only filter and must)");
  }
  const Json::Value& must = OnlyClause(Member(bool_query, "must", "\"bool\""), "\"bool.must\"");
  const Json::Value& query_string = Member(must, "query_string", "\"bool.must\"");
  request->query = QueryText(query_string);
  if (query_string.isMember("fields")) {
    const Json::Value& fields = query_string["fields"];
    if (!fields.isArray()) Bad("\"query_string.fields\" must be a list of field names");
    for (const Json::Value& field : fields) {
      if (!field.isString() || field.asString().empty()) Bad("\"query_string.fields\" must hold field names");
      request->fields.push_back(field.asString());
    }
  }
  if (bool_query.isMember("filter")) {
    const Json::Value& filter = OnlyClause(bool_query["filter"], "\"bool.filter\"");
    const Json::Value& prefix = Member(filter, "prefix", "\"bool.filter\"");
    const Json::Value& scope = Member(prefix, "path.real", "\"bool.filter.prefix\"");
    if (!scope.isString() || scope.asString().empty() || scope.asString()[0] != '/') {
      Bad("\"bool.filter.prefix.path.real\" must be an absolute folder");
    }
    request->scope = scope.asString();
  }
}

}  // namespace

SearchRequest ParseSearchRequest(const std::string& body) {
  Json::CharReaderBuilder builder;
  builder["stackLimit"] = kJsonDepthLimit;
  builder["failIfExtra"] = true;
  builder["rejectDupKeys"] = true;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value root;
  std::string errors;
  try {
    if (!reader->parse(body.data(), body.data() + body.size(), &root, &errors)) {
      std::string first = errors.substr(0, errors.find('\n'));
      if (first.compare(0, 2, "* ") == 0) first.erase(0, 2);
      Bad("the body is not valid JSON: " + first);
    }
  } catch (const Json::Exception& error) {  // the depth limit throws
    Bad(std::string("the body is not valid JSON: ") + error.what());
  }
  if (!root.isObject()) Bad("the body must be a JSON object");

  SearchRequest request;
  request.from = PageNumber(root, "from", 0, kMaxPageEnd);
  request.size = PageNumber(root, "size", 10, kMaxPageSize);
  if (request.from + request.size > kMaxPageEnd) {
    Bad("\"from\" + \"size\" must not pass " + std::to_string(kMaxPageEnd));
  }
  const Json::Value& query = Member(root, "query", "the body");
  if (!query.isObject() || query.size() != 1) Bad("\"query\" must be an object with one clause");
  if (query.isMember("query_string")) {
    request.query = QueryText(query["query_string"]);
  } else if (query.isMember("bool")) {
    ReadBoolShape(query["bool"], &request);
  } else {
    Bad("\"query\" must be a query_string or a bool clause, not \"" + query.getMemberNames().front() + "\"");
  }
  return request;
}

}  // namespace spotlightd
}  // namespace corvlumex

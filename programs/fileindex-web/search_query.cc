#include "programs/fileindex-web/search_query.h"

namespace corvlumex {
namespace web {

Json::Value QueryFromText(const std::string& text) {
  if (text.find_first_not_of(" \t") == std::string::npos) return Json::Value();
  Json::Value clause(Json::objectValue);
  clause["match"]["_all"]["query"] = text;
  clause["match"]["_all"]["operator"] = "and";
  return clause;
}

}  // namespace web
}  // namespace corvlumex

#include "programs/fileindex-web/search_query.h"

#include "fileindex/query/user_query.h"
#include "programs/fileindex-web/api_error.h"

namespace corvlumex {
namespace web {

Json::Value QueryFromText(const std::string& text) {
  try {
    return fileindex::UserQueryToSearch(text)["qsl"];
  } catch (const fileindex::UserQuerySyntaxError& error) {
    throw ApiError(400, "the search cannot be read at character " + std::to_string(error.position() + 1) + ": " + error.reason(),
                   "correct the search (the help link beside the box shows the syntax)");
  }
}

}  // namespace web
}  // namespace corvlumex

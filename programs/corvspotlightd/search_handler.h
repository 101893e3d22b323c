// One `POST /<index>/_search`: the body read (search_request.h), the query
// string translated (query_translator.h), the share searched
// (share_search.h), the answer written (answer_writer.h). Every fault is an
// answer with its status, never an exception: a bad request must not reach
// the listener's thread.
#pragma once

#include <string>

#include "programs/corvspotlightd/query_translator.h"

namespace corvlumex {
namespace spotlightd {

struct HttpAnswer {
  int status = 200;
  std::string body;  // JSON
};

class SearchHandler {
 public:
  // Words without a field go to `default_fields` unless the request names
  // its own (the newer request shape does).
  SearchHandler(FieldTable fields, std::vector<std::string> default_fields)
      : fields_(std::move(fields)), default_fields_(std::move(default_fields)) {}

  HttpAnswer Search(const std::string& index_name, const std::string& body) const;

 private:
  FieldTable fields_;
  std::vector<std::string> default_fields_;
};

}  // namespace spotlightd
}  // namespace corvlumex

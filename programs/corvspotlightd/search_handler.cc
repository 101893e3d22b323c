#include "programs/corvspotlightd/search_handler.h"

#include <chrono>

#include "common/error.h"
#include "common/log.h"
#include "programs/corvspotlightd/answer_writer.h"
#include "programs/corvspotlightd/search_request.h"
#include "programs/corvspotlightd/share_search.h"

namespace corvlumex {
namespace spotlightd {

HttpAnswer SearchHandler::Search(const std::string& index_name, const std::string& body) const {
  const auto start = std::chrono::steady_clock::now();
  try {
    const SearchRequest request = ParseSearchRequest(body);
    TranslatedQuery query =
        TranslateQueryString(request.query, request.fields.empty() ? default_fields_ : request.fields, fields_);
    if (!request.scope.empty()) query.scopes.push_back(request.scope);
    const ShareTarget share = ResolveShare(index_name, query.scopes);
    const SearchPage page = SearchShare(share, query.scopes, query.clause, request.from, request.size);
    const auto took =
        std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - start).count();
    return HttpAnswer{200, WriteSearchAnswer(index_name, page.total, page.paths, static_cast<int>(took))};
  } catch (const SearchRequestError& error) {
    return HttpAnswer{400, WriteErrorAnswer(400, "parsing_exception", error.what())};
  } catch (const QueryStringError& error) {
    return HttpAnswer{400, WriteErrorAnswer(400, "query_shard_exception", error.what())};
  } catch (const SearchFailure& failure) {
    return HttpAnswer{failure.status(), WriteErrorAnswer(failure.status(), failure.type(), failure.what())};
  } catch (const Error& error) {
    // The share registry cannot be read: nothing the request can change.
    CORV_LOG("Spotlight search on \"%s\" failed: %s", index_name.c_str(), error.what());
    return HttpAnswer{503, WriteErrorAnswer(503, "unavailable_shards_exception", error.what())};
  }
}

}  // namespace spotlightd
}  // namespace corvlumex

// The `_search` answer in the form Samba's Spotlight back end reads: an exact
// total (hits.total.value) and one hit per path, carrying only
// _source.path.real. Samba's HTTP client drops any body over
// kMaxAnswerBytes (and with it the connection's framing), so a page whose
// answer would pass that is cut short: Samba asks for the rest next, from
// the number of hits it got. Paths that are not UTF-8 are left out of the
// page (Samba's JSON reader refuses the whole page otherwise; Mac clients
// cannot show such names anyway).
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace corvlumex {
namespace spotlightd {

constexpr size_t kMaxAnswerBytes = 400 * 1024;

std::string WriteSearchAnswer(const std::string& index, int64_t total, const std::vector<std::string>& paths,
                              int took_ms);

// {"error": {"type", "reason"}, "status"}: the form of Elasticsearch's errors.
std::string WriteErrorAnswer(int status, const std::string& type, const std::string& reason);

}  // namespace spotlightd
}  // namespace corvlumex

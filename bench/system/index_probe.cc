// What a user's search sees of a share's index, for the end-to-end scripts:
//
//   system_index_probe paths SHARE          every indexed path, one a line
//   system_index_probe wait SHARE WORD SECONDS
//                                           milliseconds until a search finds WORD
//                                           in a file's text (polled every 5 ms)
//
// Exit status 2 when the search daemon cannot answer (down, or still
// opening the index): the scripts ask again. Requests are sent once, never
// through the busy retry, which would wait a quarter of an hour.
#include <json/json.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <set>
#include <string>
#include <thread>

#include "common/error.h"
#include "fileindex/elastic/comm.h"
#include "programs/frontend/search_request.h"

namespace {

using Clock = std::chrono::steady_clock;

Json::Value Search(const std::string& share, const Json::Value& qsl, unsigned from, unsigned size) {
  Json::Value answer;
  corvlumex::SendRequestImpl(answer, corvlumex::frontend::PathsPageRequest(share, qsl, from, size));
  return answer["data"]["hits"];
}

std::set<std::string> AllPaths(const std::string& share) {
  Json::Value all(Json::objectValue);
  all["match_all"] = Json::Value(Json::objectValue);
  std::set<std::string> paths;
  constexpr unsigned kPage = 1000;
  for (unsigned from = 0;; from += kPage) {
    const Json::Value hits = Search(share, all, from, kPage);
    for (const Json::Value& hit : hits) paths.insert(hit["fields"]["CORVMDPath"].asString());
    if (hits.size() < kPage) return paths;
  }
}

bool Found(const std::string& share, const std::string& word) {
  Json::Value qsl(Json::objectValue);
  qsl["match"]["CORVMDTextContent"] = word;
  try {
    return Search(share, qsl, 0, 1).size() > 0;
  } catch (const corvlumex::Error&) {
    return false;
  }
}

int Usage() {
  std::fprintf(stderr, "usage: system_index_probe paths SHARE | wait SHARE WORD SECONDS\n");
  return 64;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 3) return Usage();
  const std::string mode = argv[1], share = argv[2];
  try {
    if (mode == "paths" && argc == 3) {
      for (const std::string& path : AllPaths(share)) std::printf("%s\n", path.c_str());
      return 0;
    }
    if (mode == "wait" && argc == 5) {
      const auto start = Clock::now();
      const auto deadline = start + std::chrono::seconds(std::atoi(argv[4]));
      while (!Found(share, argv[3])) {
        if (Clock::now() > deadline) {
          std::fprintf(stderr, "%s not found within %s s\n", argv[3], argv[4]);
          return 1;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
      }
      std::printf("%lld\n", static_cast<long long>(
                                std::chrono::duration_cast<std::chrono::milliseconds>(Clock::now() - start).count()));
      return 0;
    }
  } catch (const corvlumex::Error& error) {
    std::fprintf(stderr, "search failed: %s\n", error.reason.c_str());
    return 2;
  }
  return Usage();
}

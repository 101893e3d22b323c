// Change-to-searchable latency: writes files one at a time into an indexed
// folder, each with a word of its own, and measures the time from the
// file's close to the first search that finds it (polled every 2 ms through
// corvelasticd's "search" command, as a user's search would ask).
//
//   system_latency_probe DIR SHARE COUNT
// prints one latency in milliseconds per line, then the median and p99.
#include <json/json.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "fileindex/elastic/elastic_control.h"

namespace {

using Clock = std::chrono::steady_clock;
namespace elastic = corvlumex::fileindex::elastic;

bool Found(const std::string& share, const std::string& word) {
  Json::Value request(Json::objectValue);
  request["command"] = "search";
  request["data"]["ids"].append(elastic::GetFileIndexID(share));
  request["data"]["query"]["qsl"]["match"]["CORVMDTextContent"] = word;
  request["data"]["size"] = 1;
  Json::Value answer;
  try {
    elastic::SendRequestWithPatience(answer, request);
  } catch (const corvlumex::Error&) {
    return false;
  }
  return answer["data"]["hits"].size() > 0;
}

double Percentile(std::vector<double> values, double fraction) {
  std::sort(values.begin(), values.end());
  const size_t index = std::min(values.size() - 1, static_cast<size_t>(fraction * (values.size() - 1) + 0.5));
  return values[index];
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 4) {
    fprintf(stderr, "usage: %s DIR SHARE COUNT\n", argv[0]);
    return 2;
  }
  const std::string dir = argv[1], share = argv[2];
  const int count = std::max(1, atoi(argv[3]));
  std::mt19937_64 random(static_cast<uint64_t>(getpid()) * 7919u + static_cast<uint64_t>(time(nullptr)));
  std::vector<double> latencies;
  for (int i = 0; i < count; ++i) {
    char word[32];
    snprintf(word, sizeof(word), "probe%016llx", static_cast<unsigned long long>(random()));
    const std::string path = dir + "/probe" + std::to_string(i) + ".txt";
    {
      std::ofstream out(path, std::ios::trunc);
      out << "latency probe " << i << " " << word << "\n";
    }
    const Clock::time_point written = Clock::now();
    const Clock::time_point deadline = written + std::chrono::seconds(60);
    while (!Found(share, word)) {
      if (Clock::now() > deadline) {
        fprintf(stderr, "%s was not found within 60 s\n", path.c_str());
        return 1;
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    const double ms = std::chrono::duration<double, std::milli>(Clock::now() - written).count();
    latencies.push_back(ms);
    printf("%.1f\n", ms);
  }
  printf("changes %d  median %.1f ms  p99 %.1f ms  max %.1f ms\n", count, Percentile(latencies, 0.5),
         Percentile(latencies, 0.99), *std::max_element(latencies.begin(), latencies.end()));
  return 0;
}

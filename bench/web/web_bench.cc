// Search through the web API under load, and the search page's first-load
// size. Builds a share of DOCS real files (so the access check reads the
// disk as it would on a server), indexes them straight into corvelasticd,
// starts fileindex-web, signs USERS people in and has each search in a loop
// for SECONDS; prints the latency percentiles as the clients saw them
// (loopback HTTP included, so an upper bound of the server's time).
//
//   web_bench --build BUILD [--docs 100000] [--users 20] [--seconds 20] [--think-ms 0]
//
// Each user waits --think-ms between searches (0: searches back to back, the
// saturation case). Server time is the daemon's own Server-Timing figure:
// from the request's arrival in a server thread to its answer being ready.
//
// As root the searches are made by a user the bench creates (and removes),
// signed in through PAM, so every hit passes the per-user access check; as
// another user, by that user through the sandbox's one-time link.
#include <httplib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <random>
#include <regex>
#include <thread>

#include "common/json_util.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/elastic_control.h"
#include "tests/support/child_process.h"

namespace {

using corvlumex::testing_support::ChildProcess;
using corvlumex::testing_support::PollUntil;
using Clock = std::chrono::steady_clock;
namespace fs = std::filesystem;

struct Options {
  std::string build;
  long docs = 100000;
  int users = 20;
  int seconds = 20;
  int think_ms = 0;
};

std::vector<std::string> Vocabulary() {
  std::vector<std::string> words;
  const char* syllables[] = {"ka", "lo", "mi", "ne", "ru", "sa", "ti", "vo", "ze", "pa", "do", "fe", "gu", "hi", "jo"};
  for (const char* a : syllables) {
    for (const char* b : syllables) {
      for (const char* c : {"n", "r", "s", "l", "m", "t", "k", "x", "d"}) words.push_back(std::string(a) + b + c);
    }
  }
  return words;  // 2,025 words
}

void Ask(const Json::Value& request) {
  corvdaemon::DomainSockConnection connection(corvlumex::ElasticSocketPath());
  std::string answer;
  if (!connection.Connect() || !connection.Send(corvlumex::JsonToString(request)) || !connection.Recv(answer) ||
      answer.find("\"success\":true") == std::string::npos) {
    std::cerr << "corvelasticd refused: " << answer.substr(0, 300) << "\n";
    std::exit(1);
  }
}

void Ingest(const std::string& share_dir, long docs, const std::vector<std::string>& words) {
  std::mt19937 random(42);
  Json::Value batch(Json::arrayValue);
  const auto flush = [&] {
    Json::Value request;
    request["compound"] = batch;
    Ask(request);
    Json::Value commit;
    commit["command"] = "commit";
    commit["data"]["id"] = "fileindex_share";
    Ask(commit);
    batch = Json::Value(Json::arrayValue);
  };
  for (long i = 0; i < docs; ++i) {
    const std::string dir = share_dir + "/d" + std::to_string(i / 1000);
    if (i % 1000 == 0) fs::create_directories(dir);
    std::string text;
    for (int w = 0; w < 12; ++w) text += (w ? " " : "") + words[random() % words.size()];
    const std::string name = words[random() % words.size()] + "-" + std::to_string(i) + ".txt";
    const std::string path = dir + "/" + name;
    std::ofstream(path) << text << "\n";
    Json::Value doc;
    doc["CORVMDPath"] = path;
    doc["CORVMDParent"] = dir;
    doc["CORVMDFSName"] = name;
    doc["CORVMDSearchFileName"] = name;
    doc["CORVMDDisplayName"] = name;
    doc["CORVMDExtension"] = "txt";
    doc["CORVMDFSSize"] = static_cast<Json::Int64>(text.size() + 1);
    doc["CORVMDFSContentChangeDate"] = static_cast<Json::Int64>(1700000000 + i);
    doc["CORVMDIsDir"] = false;
    doc["CORVMDTextContent"] = text;
    Json::Value element;
    element["command"] = "document_upsert_by_id";
    element["data"]["id"] = "fileindex_share";
    element["data"]["doc_id"] = path;
    element["data"]["data"] = doc;
    batch.append(element);
    if (batch.size() == 500) flush();
  }
  if (!batch.empty()) flush();
}

std::string CookieOf(const httplib::Result& result) {
  const std::string header = result ? result->get_header_value("Set-Cookie") : "";
  return header.substr(0, header.find(';'));
}

long long FirstLoadBytes(int port) {
  httplib::Client client("127.0.0.1", port);
  const auto page = client.Get("/");
  if (!page) return -1;
  long long total = static_cast<long long>(page->body.size());
  const std::regex linked(R"((?:src|href)="(/?[A-Za-z0-9_.-]+\.(?:js|css))\")");
  for (std::sregex_iterator it(page->body.begin(), page->body.end(), linked), end; it != end; ++it) {
    std::string path = (*it)[1];
    if (path[0] != '/') path = "/" + path;
    const auto file = client.Get(path.c_str());
    if (file) total += static_cast<long long>(file->body.size());
  }
  return total;
}

double Percentile(std::vector<double> values, double fraction) {
  if (values.empty()) return 0;
  std::sort(values.begin(), values.end());
  return values[std::min(values.size() - 1, static_cast<size_t>(fraction * static_cast<double>(values.size())))];
}

}  // namespace

int main(int argc, char** argv) {
  Options options;
  for (int i = 1; i + 1 < argc; i += 2) {
    const std::string flag = argv[i];
    if (flag == "--build") options.build = argv[i + 1];
    else if (flag == "--docs") options.docs = std::atol(argv[i + 1]);
    else if (flag == "--users") options.users = std::atoi(argv[i + 1]);
    else if (flag == "--seconds") options.seconds = std::atoi(argv[i + 1]);
    else if (flag == "--think-ms") options.think_ms = std::atoi(argv[i + 1]);
  }
  if (options.build.empty()) {
    std::cerr << "usage: web_bench --build BUILD [--docs N] [--users N] [--seconds N]\n";
    return 2;
  }
  std::string pattern = access("/dev/shm", W_OK) == 0 ? "/dev/shm/fileindex-web-bench-XXXXXX" : "/tmp/fileindex-web-bench-XXXXXX";
  const std::string work = mkdtemp(&pattern[0]);
  chmod(work.c_str(), 0755);
  const std::string root = work + "/root", share_dir = work + "/volume1/share";
  fs::create_directories(root + "/etc/corvlumex");
  fs::create_directories(root + "/var/run");
  fs::create_directories(share_dir);
  chmod((work + "/volume1").c_str(), 0755);
  std::ofstream(root + "/etc/corvlumex/shares.json") << "[{\"name\": \"share\", \"path\": \"" << share_dir << "\"}]\n";
  setenv("CORVLUMEX_ROOT", root.c_str(), 1);

  const std::string program_dir = options.build + "/programs/";
  int status = 0;
  {
    ChildProcess search(program_dir + "corvelasticd/corvelasticd", {"--log-stderr"}, work + "/corvelasticd.log");
    PollUntil([&] { return access((root + "/var/run/corvelasticd.sock").c_str(), F_OK) == 0; }, std::chrono::seconds(30));
    corvlumex::fileindex::elastic::ShareIndexCreate("share");
    const auto ingest_start = Clock::now();
    Ingest(share_dir, options.docs, Vocabulary());
    std::cout << "indexed " << options.docs << " documents in "
              << std::chrono::duration<double>(Clock::now() - ingest_start).count() << " s\n";

    const int port = 20000 + static_cast<int>(getpid() % 20000);
    const std::string link_file = root + "/var/run/fileindex-web.sign-in";
    ChildProcess web(program_dir + "fileindex-web/fileindex-web",
                     {"--port", std::to_string(port), "--web-root", std::string(FILEINDEX_SOURCE_DIR) + "/web",
                      "--sign-in-link-file", link_file, "--threads", std::to_string(options.users + 4)},
                     work + "/fileindex-web.log");
    PollUntil([&] { return access(link_file.c_str(), F_OK) == 0; }, std::chrono::seconds(30));

    // Sessions: a bench user through PAM as root, else the one-time link.
    std::vector<std::string> cookies;
    const std::string user = "corvbench" + std::to_string(getpid() % 10000);
    const bool as_root = geteuid() == 0;
    if (as_root) {
      const std::string make = "useradd -M -N -s /usr/sbin/nologin " + user + " && echo '" + user + ":Bench-Pass-9' | chpasswd";
      if (std::system(make.c_str()) != 0) return 1;
      for (int i = 0; i < options.users; ++i) {
        httplib::Client client("127.0.0.1", port);
        cookies.push_back(CookieOf(client.Post("/api/sign-in", "{\"user\": \"" + user + "\", \"password\": \"Bench-Pass-9\"}",
                                               "application/json")));
      }
    } else {
      std::string link;
      std::getline(std::ifstream(link_file), link);
      httplib::Client client("127.0.0.1", port);
      const std::string cookie = CookieOf(client.Get(link.substr(link.find("/sign-in")).c_str()));
      cookies.assign(static_cast<size_t>(options.users), cookie);
    }
    std::cout << "searching as " << (as_root ? user + " (signed in through PAM)" : std::string("the bench's own user")) << "\n";

    const std::vector<std::string> words = Vocabulary();
    std::vector<std::vector<double>> latencies(static_cast<size_t>(options.users));
    std::vector<std::vector<double>> server_times(static_cast<size_t>(options.users));
    std::atomic<long> failures{0}, hits{0};
    const auto stop_at = Clock::now() + std::chrono::seconds(options.seconds);
    std::vector<std::thread> clients;
    for (int u = 0; u < options.users; ++u) {
      clients.emplace_back([&, u] {
        std::mt19937 random(static_cast<unsigned>(u + 1));
        httplib::Client client("127.0.0.1", port);
        client.set_keep_alive(true);
        client.set_tcp_nodelay(true);
        const httplib::Headers headers = {{"Cookie", cookies[static_cast<size_t>(u)]}};
        // People do not all press Enter in the same millisecond: with a think
        // time, the users' first searches are spread over it.
        if (options.think_ms > 0) std::this_thread::sleep_for(std::chrono::milliseconds(options.think_ms * u / options.users));
        while (Clock::now() < stop_at) {
          const std::string path = "/api/search?size=20&q=" + words[random() % words.size()];
          const auto start = Clock::now();
          const auto result = client.Get(path.c_str(), headers);
          latencies[static_cast<size_t>(u)].push_back(std::chrono::duration<double, std::milli>(Clock::now() - start).count());
          if (result) {
            const std::string timing = result->get_header_value("Server-Timing");
            const size_t at = timing.find("dur=");
            if (at != std::string::npos) server_times[static_cast<size_t>(u)].push_back(std::atof(timing.c_str() + at + 4));
          }
          if (options.think_ms > 0) std::this_thread::sleep_for(std::chrono::milliseconds(options.think_ms));
          if (!result || result->status != 200) {
            ++failures;
          } else if (result->body.find("\"hits\":[]") == std::string::npos) {
            ++hits;
          }
        }
      });
    }
    for (std::thread& client : clients) client.join();
    std::vector<double> all;
    for (const auto& list : latencies) all.insert(all.end(), list.begin(), list.end());
    std::cout << "searches: " << all.size() << " by " << options.users << " users (think time " << options.think_ms << " ms) in " << options.seconds << " s ("
              << static_cast<double>(all.size()) / options.seconds << "/s), " << failures << " failed, " << hits
              << " with hits\n";
    std::vector<double> server;
    for (const auto& list : server_times) server.insert(server.end(), list.begin(), list.end());
    std::cout << "server time ms: p50 " << Percentile(server, 0.50) << "  p90 " << Percentile(server, 0.90) << "  p99 "
              << Percentile(server, 0.99) << "  max " << Percentile(server, 1.0) << "\n";
    std::cout << "client latency ms: p50 " << Percentile(all, 0.50) << "  p90 " << Percentile(all, 0.90) << "  p99 "
              << Percentile(all, 0.99) << "  max " << Percentile(all, 1.0) << "\n";
    std::cout << "search page first load: " << FirstLoadBytes(port) << " bytes (HTML, CSS, scripts; no images or fonts)\n";
    status = failures == 0 ? 0 : 1;
    if (as_root) std::system(("userdel " + user).c_str());
  }
  fs::remove_all(work);
  return status;
}

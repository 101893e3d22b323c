// End-to-end figures of corvelasticd on a private socket: ingest through the
// library's path (one connection per request, a commit per 1,000 documents),
// name-substring, word, phrase, prefix and filtered searches through the
// socket with the access filter of an ordinary user, a prefix delete of 10% of the documents, the
// daemon's peak memory and the database size against the text indexed.
// `--commit-every 0` commits once at the end, as the first index of a folder
// does; the index folder's size is sampled during the ingest, so its peak
// (database plus write-ahead log) can be set against the final size.
//
//   corvelasticd_bench --daemon BUILD/programs/corvelasticd/corvelasticd --docs 1000000 --work DIR
#include <dirent.h>
#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstring>
#include <fstream>
#include <functional>
#include <iostream>
#include <iterator>
#include <random>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "common/frame.h"
#include "common/frame_reader.h"
#include "common/json_util.h"
#include "tests/support/frame_client.h"

namespace {

using Clock = std::chrono::steady_clock;
using corvlumex::JsonFromString;
using corvlumex::JsonToString;

struct Options {
  std::string daemon;
  std::string work = "/tmp/corvelasticd-bench";
  long docs = 100000;
  int queries = 300;
  bool reuse = false;  // the work directory holds a finished ingest: measure searches (and the delete) again
  bool keep = false;   // no delete, so the index can be measured again with --reuse
  long commit_every = 1000;  // 0: one commit after the whole ingest
  std::string only;  // one kind of search (name, word, phrase, prefix, filtered), for a profiler; empty: all
};

std::string g_socket;

int Connect() { return corvlumex::testing_support::ConnectTo(g_socket); }

Json::Value Request(const Json::Value& request) {
  const int fd = Connect();
  if (fd < 0) throw std::runtime_error("connect failed");
  corvlumex::WriteFrame(fd, JsonToString(request));
  std::string text;
  corvlumex::ReadFrameBounded(fd, 1u << 30, 600000, 600000, &text);
  close(fd);
  Json::Value answer;
  JsonFromString(answer, text);
  if (!answer["success"].asBool()) throw std::runtime_error("request failed: " + text.substr(0, 300));
  return answer;
}

Json::Value Command(const std::string& command, Json::Value data) {
  data["id"] = "fileindex_bench";
  Json::Value request;
  request["command"] = command;
  request["data"] = data;
  return Request(request);
}

// A vocabulary of pronounceable words, drawn with a skewed frequency like real text.
struct Words {
  std::vector<std::string> list;
  std::mt19937_64 random{42};
  Words() {
    const char* consonants = "bcdfghklmnprstvz";
    const char* vowels = "aeiou";
    std::mt19937_64 g(7);
    for (int i = 0; i < 50000; ++i) {
      std::string word;
      const int syllables = 2 + static_cast<int>(g() % 3);
      for (int s = 0; s < syllables; ++s) {
        word += consonants[g() % 16];
        word += vowels[g() % 5];
      }
      list.push_back(word);
    }
  }
  const std::string& Pick() {
    // Square of a uniform number: low indexes are much more frequent.
    const double u = std::uniform_real_distribution<double>(0, 1)(random);
    return list[static_cast<size_t>(u * u * u * (list.size() - 1))];
  }
};

std::string PathOf(const std::string& share, long i) {
  return share + "/g" + std::to_string(i % 10) + "/d" + std::to_string((i / 10) % 100) + "/" + "file-" + std::to_string(i);
}

double Percentile(std::vector<double> values, double p) {
  std::sort(values.begin(), values.end());
  return values[std::min(values.size() - 1, static_cast<size_t>(p * values.size()))];
}

// Starts the daemon (the path may be a wrapper, e.g. one that runs it under
// a profiler) and waits until its socket answers.
pid_t StartDaemon(const Options& options) {
  const pid_t daemon = fork();
  if (daemon == 0) {
    setenv("CORVLUMEX_ROOT", options.work.c_str(), 1);
    execl(options.daemon.c_str(), options.daemon.c_str(), "--socket", g_socket.c_str(), static_cast<char*>(nullptr));
    _exit(127);
  }
  for (int i = 0; i < 12000; ++i) {
    const int fd = Connect();
    if (fd >= 0) {
      close(fd);
      break;
    }
    usleep(5000);
  }
  return daemon;
}

void StopDaemon(pid_t daemon) {
  kill(daemon, SIGTERM);
  waitpid(daemon, nullptr, 0);
}

// User + system CPU seconds the process has used so far.
double CpuSeconds(pid_t pid) {
  std::ifstream stat("/proc/" + std::to_string(pid) + "/stat");
  std::string text((std::istreambuf_iterator<char>(stat)), std::istreambuf_iterator<char>());
  std::istringstream fields(text.substr(text.rfind(')') + 2));
  std::string field;
  double ticks = 0;
  for (int i = 3; i <= 15 && fields >> field; ++i) {
    if (i == 14 || i == 15) ticks += atof(field.c_str());
  }
  return ticks / static_cast<double>(sysconf(_SC_CLK_TCK));
}

double LoadAverage() {
  std::ifstream load("/proc/loadavg");
  double one_minute = 0;
  load >> one_minute;
  return one_minute;
}

// Time the daemon's threads spent on a CPU and waiting for one (scheduler
// statistics, nanoseconds): the part of a query's latency that is the
// daemon's own work, apart from the wait that a busy machine adds.
struct ThreadTimes {
  double cpu_ns = 0;
  double wait_ns = 0;
};

ThreadTimes DaemonThreadTimes(pid_t pid) {
  ThreadTimes times;
  const std::string tasks = "/proc/" + std::to_string(pid) + "/task";
  DIR* dir = opendir(tasks.c_str());
  if (dir == nullptr) return times;
  while (const struct dirent* entry = readdir(dir)) {
    if (entry->d_name[0] == '.') continue;
    std::ifstream stat(tasks + "/" + entry->d_name + "/schedstat");
    double cpu = 0, wait = 0;
    if (stat >> cpu >> wait) {
      times.cpu_ns += cpu;
      times.wait_ns += wait;
    }
  }
  closedir(dir);
  return times;
}

// Per query: latency, readable hits, daemon CPU, daemon wait for a CPU.
struct QueryFigures {
  std::vector<double> ms, cpu_ms, wait_ms;
  double hits = 0;
  void Print(const char* what) const;
};

void QueryFigures::Print(const char* what) const {
  if (ms.empty()) return;
  std::cout << what << ": median " << Percentile(ms, 0.5) << " ms, p99 " << Percentile(ms, 0.99) << " ms ("
            << ms.size() << " queries, " << hits / ms.size() << " readable hits on average); the daemon's CPU per query: median "
            << Percentile(cpu_ms, 0.5) << " ms, p99 " << Percentile(cpu_ms, 0.99) << " ms; its wait for a CPU: median "
            << Percentile(wait_ms, 0.5) << " ms, p99 " << Percentile(wait_ms, 0.99) << " ms\n";
}

QueryFigures Split(const std::vector<double>& raw) {
  QueryFigures figures;
  for (size_t i = 0; i + 3 < raw.size(); i += 4) {
    figures.ms.push_back(raw[i]);
    figures.hits += raw[i + 1];
    figures.cpu_ms.push_back(raw[i + 2]);
    figures.wait_ms.push_back(raw[i + 3]);
  }
  return figures;
}

long PeakMemoryKb(pid_t pid) {
  std::ifstream status("/proc/" + std::to_string(pid) + "/status");
  std::string line;
  while (std::getline(status, line)) {
    if (line.rfind("VmHWM:", 0) == 0) return atol(line.c_str() + 6);
  }
  return -1;
}

long long FileSize(const std::string& path) {
  struct stat info;
  return stat(path.c_str(), &info) == 0 ? info.st_size : 0;
}

// The disk space the files of a folder take (blocks allocated, not lengths).
long long FolderBytes(const std::string& folder) {
  long long total = 0;
  DIR* dir = opendir(folder.c_str());
  if (dir == nullptr) return 0;
  while (dirent* entry = readdir(dir)) {
    struct stat info;
    if (stat((folder + "/" + entry->d_name).c_str(), &info) == 0 && S_ISREG(info.st_mode)) total += info.st_blocks * 512LL;
  }
  closedir(dir);
  return total;
}

// Runs `body` as an ordinary user when this is root, so the access filter checks every hit.
template <typename Body>
std::vector<double> AsOrdinaryUser(Body body) {
  int pipe_fds[2];
  if (pipe(pipe_fds) != 0) return {};
  const pid_t child = fork();
  if (child == 0) {
    close(pipe_fds[0]);
    if (geteuid() == 0) {
      const struct passwd* nobody = getpwnam("nobody");
      if (nobody == nullptr || setgroups(0, nullptr) != 0 || setgid(nobody->pw_gid) != 0 || setuid(nobody->pw_uid) != 0) _exit(3);
    }
    const std::vector<double> out = body();
    if (write(pipe_fds[1], out.data(), out.size() * sizeof(double)) < 0) _exit(4);
    _exit(0);
  }
  close(pipe_fds[1]);
  std::vector<double> out;
  double value;
  while (read(pipe_fds[0], &value, sizeof(value)) == sizeof(value)) out.push_back(value);
  close(pipe_fds[0]);
  waitpid(child, nullptr, 0);
  return out;
}

}  // namespace

int main(int argc, char** argv) {
  Options options;
  for (int i = 1; i + 1 < argc; i += 2) {
    const std::string key = argv[i];
    if (key == "--daemon") options.daemon = argv[i + 1];
    else if (key == "--work") options.work = argv[i + 1];
    else if (key == "--docs") options.docs = atol(argv[i + 1]);
    else if (key == "--queries") options.queries = atoi(argv[i + 1]);
    else if (key == "--reuse") options.reuse = std::string(argv[i + 1]) == "1";
    else if (key == "--keep") options.keep = std::string(argv[i + 1]) == "1";
    else if (key == "--commit-every") options.commit_every = atol(argv[i + 1]);
    else if (key == "--only") options.only = argv[i + 1];
  }
  if (options.daemon.empty()) {
    std::cerr << "usage: corvelasticd_bench --daemon PATH [--docs N] [--work DIR] [--queries N] [--reuse 1] [--keep 1] [--commit-every N] [--only name|word|phrase|prefix|filtered]\n";
    return 2;
  }
  signal(SIGPIPE, SIG_IGN);
  if (!options.reuse && system(("rm -rf '" + options.work + "' && mkdir -p '" + options.work + "'").c_str()) != 0) return 1;
  chmod(options.work.c_str(), 0755);
  g_socket = options.work + "/corvelasticd.sock";
  const std::string share = options.work + "/share";

  // The files exist, readable by everybody, so an ordinary user's searches find them.
  if (!options.reuse) std::cerr << "creating " << options.docs << " files...\n";
  for (long i = 0; i < options.docs && !options.reuse; ++i) {
    const std::string path = PathOf(share, i);
    const int fd = open(path.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0644);
    if (fd < 0) {
      if (system(("mkdir -p '" + path.substr(0, path.rfind('/')) + "'").c_str()) != 0) return 1;
      close(open(path.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0644));
    } else {
      close(fd);
    }
  }
  if (!options.reuse && system(("chmod -R a+rX '" + share + "'").c_str()) != 0) return 1;

  pid_t daemon = StartDaemon(options);

  Json::Value create;
  create["path"] = options.work + "/index";
  JsonFromString(create["mappings"], R"({"property_id": "CORVMDPath",
    "default": {"type": "string", "analyzer": "corvstandard", "required": false, "stored": true, "_all": true},
    "properties": {"CORVMDPath": {"analyzer": "keyword", "required": true, "_all": false},
      "CORVMDFSName": {"analyzer": "keyword", "_all": false}, "CORVMDParent": {"analyzer": "keyword", "_all": false},
      "CORVMDExtension": {"analyzer": "keyword", "_all": false}, "CORVMDFSSize": {"type": "int"},
      "CORVMDFSContentChangeDate": {"type": "int"}, "CORVMDIsDir": {"type": "bool", "_all": false},
      "CORVMDTitle": {"type": "text"}, "CORVMDTextContent": {"type": "text"},
      "CORVMDSearchFileName": {"type": "text", "analyzer": "white space", "preprocess": ["tolower", "ngram"]}}})");
  if (!options.reuse) Command("index_create", create);

  Words words;
  std::vector<std::string> names, phrases;
  long long raw_json = 0, raw_text = 0;
  const auto ingest_start = Clock::now();
  const double client_cpu_start = CpuSeconds(getpid());
  // The index folder's size every 50 ms: what the volume must hold while indexing.
  std::atomic<bool> ingesting{true};
  std::atomic<long long> peak_folder_bytes{0};
  std::thread folder_sampler([&] {
    while (ingesting.load()) {
      peak_folder_bytes = std::max(peak_folder_bytes.load(), FolderBytes(options.work + "/index"));
      usleep(50000);
    }
  });
  for (long i = 0; i < options.docs; ++i) {
    const std::string path = PathOf(share, i);
    std::string text;
    const int count = 10 + static_cast<int>(words.random() % 40);
    for (int w = 0; w < count; ++w) text += (w ? " " : "") + words.Pick();
    const std::string name = words.Pick() + "-" + words.Pick() + "-" + std::to_string(i) + ".txt";
    Json::Value doc;
    doc["CORVMDPath"] = path;
    doc["CORVMDParent"] = path.substr(0, path.rfind('/'));
    doc["CORVMDFSName"] = name;
    doc["CORVMDSearchFileName"] = name;
    doc["CORVMDExtension"] = "txt";
    doc["CORVMDFSSize"] = static_cast<Json::Int64>(words.random() % 1000000);
    doc["CORVMDFSContentChangeDate"] = static_cast<Json::Int64>(1600000000 + i);
    doc["CORVMDIsDir"] = false;
    doc["CORVMDTextContent"] = text;
    raw_json += static_cast<long long>(JsonToString(doc).size());
    raw_text += static_cast<long long>(path.size() * 2 + name.size() * 2 + 3 + text.size());
    if (i % 997 == 0) {
      names.push_back(name);
      phrases.push_back(text.substr(0, text.find(' ', text.find(' ') + 1)));  // the first two words
    }
    Json::Value data;
    data["doc_id"] = path;
    data["data"] = doc;
    if (options.reuse) continue;  // the same documents, already indexed
    Command("document_upsert_by_id", data);
    if (options.commit_every > 0 && (i + 1) % options.commit_every == 0) Command("commit", Json::Value(Json::objectValue));
  }
  if (!options.reuse) Command("commit", Json::Value(Json::objectValue));
  peak_folder_bytes = std::max(peak_folder_bytes.load(), FolderBytes(options.work + "/index"));
  ingesting = false;
  folder_sampler.join();
  const double ingest_seconds = std::chrono::duration<double>(Clock::now() - ingest_start).count();
  const double ingest_cpu = CpuSeconds(daemon);
  const double client_cpu = CpuSeconds(getpid()) - client_cpu_start;
  const double ingest_load = LoadAverage();

  // The size right after ingest: the daemon stops (its last connection folds
  // the write-ahead log into the database file), then starts again, which
  // also times the reopening of a full index.
  long peak_kb = PeakMemoryKb(daemon);
  StopDaemon(daemon);
  const std::string db = options.work + "/index/corvelasticd.db";
  const long long db_bytes = FileSize(db) + FileSize(db + "-wal");
  const auto restart_start = Clock::now();
  daemon = StartDaemon(options);
  Json::Value list_request;
  list_request["command"] = "index_list";
  for (int i = 0; i < 60000 && Request(list_request)["data"][0]["state"].asString() != "ready"; ++i) usleep(1000);
  const double restart_seconds = std::chrono::duration<double>(Clock::now() - restart_start).count();

  // Queries: substrings from the middle of names, and words of middling frequency.
  std::vector<std::string> substrings, terms, prefixes;
  for (int q = 0; q < options.queries; ++q) {
    const std::string& name = names[static_cast<size_t>(q) % names.size()];
    substrings.push_back(name.substr(2, 5));
    terms.push_back(words.list[1000 + static_cast<size_t>(q) * 37 % 20000]);
    prefixes.push_back(terms.back().substr(0, 4));
  }
  const auto clause = [](const char* kind, const char* field, const std::string& text) {
    Json::Value qsl;
    qsl[kind][field] = text;
    return qsl;
  };
  auto timed = [&](const char* kind, const std::vector<std::string>& texts,
                   const std::function<Json::Value(const std::string&)>& qsl) {
    if (!options.only.empty() && options.only != kind) return std::vector<double>();
    return AsOrdinaryUser([&] {
      std::vector<double> ms;
      for (const std::string& text : texts) {
        Json::Value data;
        data["query"]["qsl"] = qsl(text);
        data["size"] = 20;
        data["load_field"].append("CORVMDFSName");
        Json::Value request;
        request["command"] = "search";
        request["data"] = data;
        request["data"]["id"] = "fileindex_bench";
        const ThreadTimes before = DaemonThreadTimes(daemon);
        const auto start = Clock::now();
        const Json::Value answer = Request(request);
        ms.push_back(std::chrono::duration<double, std::milli>(Clock::now() - start).count());
        const ThreadTimes after = DaemonThreadTimes(daemon);
        ms.push_back(answer["data"]["total"].asDouble());
        ms.push_back((after.cpu_ns - before.cpu_ns) / 1e6);
        ms.push_back((after.wait_ns - before.wait_ns) / 1e6);
      }
      return ms;
    });
  };
  std::vector<double> name_raw = timed("name", substrings, [&](const std::string& t) { return clause("match", "CORVMDSearchFileName", t); });
  std::vector<double> word_raw = timed("word", terms, [&](const std::string& t) { return clause("match", "_all", t); });
  std::vector<double> phrase_raw = timed("phrase", phrases, [&](const std::string& t) { return clause("match_phrase", "_all", t); });
  std::vector<double> prefix_raw = timed("prefix", prefixes, [&](const std::string& t) { return clause("prefix", "_all", t); });
  // A word with the filters people add: a size and a date range.
  std::vector<double> filtered_raw = timed("filtered", terms, [&](const std::string& t) {
    Json::Value qsl;
    qsl["bool"]["must"].append(clause("match", "_all", t));
    Json::Value size, date;
    size["range"]["CORVMDFSSize"]["lt"] = 500000;
    date["range"]["CORVMDFSContentChangeDate"]["gte"] = 1600000000 + options.docs / 2;
    qsl["bool"]["filter"].append(size);
    qsl["bool"]["filter"].append(date);
    return qsl;
  });
  const double search_load = LoadAverage();
  QueryFigures names_found = Split(name_raw), words_found = Split(word_raw), phrases_found = Split(phrase_raw),
               prefixes_found = Split(prefix_raw), filtered_found = Split(filtered_raw);
  const auto print_searches = [&] {
    names_found.Print("name substring search");
    words_found.Print("word search");
    phrases_found.Print("phrase search (two words)");
    prefixes_found.Print("prefix search (4 letters)");
    filtered_found.Print("word search with size and date filters");
  };

  const auto print_ingest = [&] {
    if (options.reuse) return;  // nothing was ingested
    std::cout << "ingest: " << static_cast<long>(options.docs / ingest_seconds) << " documents/s (" << ingest_seconds
              << " s; daemon CPU " << ingest_cpu << " s = " << static_cast<long>(options.docs / std::max(ingest_cpu, 1e-3))
              << " documents per CPU second; the client's CPU " << client_cpu << " s; load average " << ingest_load << ")\n";
    std::cout << "index folder during the ingest (commit every " << options.commit_every << "): peak "
              << peak_folder_bytes / 1e6 << " MB, database after the ingest " << db_bytes / 1e6 << " MB\n";
  };
  if (options.keep) {
    StopDaemon(daemon);
    std::cout << "documents: " << options.docs << "\n";
    print_ingest();
    print_searches();
    std::cout << "load average after the searches: " << search_load << "\n";
    return 0;
  }
  Json::Value del;
  del["query"]["qsl"]["prefix"]["CORVMDPath"] = share + "/g3/";
  const auto delete_start = Clock::now();
  const Json::Value deleted = Command("document_del_by_query", del);
  Command("commit", Json::Value(Json::objectValue));
  const double delete_seconds = std::chrono::duration<double>(Clock::now() - delete_start).count();

  peak_kb = std::max(peak_kb, PeakMemoryKb(daemon));
  StopDaemon(daemon);

  std::cout << "documents: " << options.docs << "\n";
  print_ingest();
  std::cout << "reopening the index after a restart: " << restart_seconds << " s\n";
  print_searches();
  std::cout << "load average after the searches: " << search_load << "\n";
  std::cout << "prefix delete of " << deleted["data"]["deleted"].asInt64() << " documents: " << delete_seconds << " s\n";
  std::cout << "peak memory of the daemon: " << peak_kb / 1024 << " MB\n";
  std::cout << "database after ingest: " << db_bytes / 1048576.0 << " MB; documents as JSON: " << raw_json / 1048576.0
            << " MB; text of the indexed fields: " << raw_text / 1048576.0 << " MB; ratio to JSON "
            << static_cast<double>(db_bytes) / raw_json << "\n";
  return 0;
}

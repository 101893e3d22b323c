// Sends malformed and hostile frames of many kinds to each daemon's socket
// (corvelasticd, fileindexd's command socket, and the extraction worker's
// socket pair) and counts how each was met: an error answer, a clean close
// where no answer is possible (a cut frame), or something unexpected (a
// success, a hang, a crash). Every daemon must still answer a good request
// after each kind and at the end. See bench/hostile/run_hostile.
//
//   hostile_frames --build BUILD_DIR --work DIR [--frames N]
#include <fcntl.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "common/frame_reader.h"
#include "common/json_util.h"
#include "platform/linux/extract/worker_protocol.h"
#include "tests/support/child_process.h"
#include "tests/support/frame_client.h"

namespace {

using corvlumex::JsonFromString;
using corvlumex::testing_support::ChildProcess;
using corvlumex::testing_support::ConnectTo;
using corvlumex::testing_support::Frame;
using corvlumex::testing_support::SendRaw;
using Clock = std::chrono::steady_clock;

constexpr int kAnswerWaitMs = 20000;  // longer than this counts as a hang

std::string Repeat(const std::string& piece, size_t times) {
  std::string out;
  for (size_t i = 0; i < times; ++i) out += piece;
  return out;
}

std::string Words(int count) {
  std::string out;
  for (int i = 0; i < count; ++i) out += "w" + std::to_string(i) + " ";
  return out;
}

std::string LengthPrefix(uint32_t length) { return std::string(reinterpret_cast<const char*>(&length), sizeof(length)); }

// One kind of hostile input: the bytes, and whether an answer is possible
// (a frame cut short can only be met with a close).
struct Kind {
  std::string name;
  std::function<std::string(int n)> bytes;
  bool answerable = true;
};

// The kinds for a daemon whose requests name their command with `key`. The
// worker's requests carry no query: its deep request nests in a member it reads.
std::vector<Kind> Kinds(const std::string& key, const std::string& good, bool worker) {
  const std::string good_frame = Frame(good);
  return {
      {"nested arrays (1,001)", [](int) { return Frame(Repeat("[", 1001) + Repeat("]", 1001)); }},
      {"nested objects (1,001)", [](int) { return Frame(Repeat(R"({"a":)", 1001) + "1" + Repeat("}", 1001)); }},
      {"cut in the length", [=](int n) { return good_frame.substr(0, 1 + n % 3); }, false},
      {"closed mid-frame", [=](int n) { return good_frame.substr(0, 4 + n % (good_frame.size() - 5)); }, false},
      {"length of 4 GiB", [](int) { return LengthPrefix(0xFFFFFFF0u) + "{}"; }},
      {"not UTF-8", [=](int) { return Frame("{\"" + key + "\": \"\xff\xfe\x80\xc3\", \"need_meta\": \"\xff\"}"); }},
      {"wrong types", [=](int n) {
         const std::string bodies[] = {"{\"" + key + "\": 5}", "{\"" + key + "\": [\"status\"]}", "[1, 2, 3]", "\"text\"",
                                       worker ? R"({"name": "x", "need_meta": 7})"
                                              : "{\"" + key + "\": \"search\", \"data\": {\"query\": [], \"size\": \"x\"}}"};
         return Frame(bodies[n % 5]);
       }},
      {"giant match (100,000 words)", [=](int) {
         return Frame("{\"" + key + "\": \"search\", \"data\": {\"query\": {\"qsl\": {\"match\": {\"_all\": \"" + Words(100000) + "\"}}}}}");
       }},
      {"deep bool (40 levels)", [=](int) {
         if (worker) return Frame(R"({"name": "x", "need_meta": )" + Repeat("[", 900) + Repeat("]", 900) + "}");
         return Frame("{\"" + key + "\": \"search\", \"data\": {\"query\": {\"qsl\": " + Repeat(R"({"bool": {"must": [)", 40) +
                      R"({"match_all": {}})" + Repeat("]}}", 40) + "}}}");
       }},
      {"empty frame", [](int) { return LengthPrefix(0); }},
      {"NUL bytes", [=](int) { return Frame("{\"" + key + "\":" + std::string(2, '\0') + "\"index_list\"}"); }},
      {"random bytes", [](int n) {
         std::string noise;
         unsigned state = 2166136261u + static_cast<unsigned>(n);
         for (int i = 0; i < 512; ++i) noise += static_cast<char>((state = state * 1103515245u + 12345u) >> 16);
         return Frame(noise);
       }},
  };
}

struct Tally {
  int sent = 0, error_answers = 0, clean_closes = 0, unexpected = 0;
  double slowest_ms = 0;
};

// The answer text's error code; 0 for a success, -1 when it is not an answer.
int CodeOf(const std::string& text) {
  Json::Value answer;
  if (!JsonFromString(answer, text) || !answer.isObject() || !answer["success"].isBool()) return -1;
  return answer["success"].asBool() ? 0 : answer["error"]["code"].asInt();
}

bool Alive(const std::string& socket, const std::string& good) {
  try {
    return CodeOf(SendRaw(socket, Frame(good), kAnswerWaitMs)) == 0;
  } catch (const std::exception&) {
    return false;
  }
}

// Sends every kind in turn until `frames` were sent; a good request after each.
std::map<std::string, Tally> AttackSocket(const std::string& socket, const std::string& key, const std::string& good,
                                          int frames, bool* alive) {
  std::map<std::string, Tally> tallies;
  const std::vector<Kind> kinds = Kinds(key, good, false);
  *alive = true;
  for (int i = 0; i < frames && *alive; ++i) {
    const Kind& kind = kinds[i % kinds.size()];
    Tally& tally = tallies[kind.name];
    const Clock::time_point start = Clock::now();
    std::string answer;
    try {
      answer = SendRaw(socket, kind.bytes(i / static_cast<int>(kinds.size())), kAnswerWaitMs);
    } catch (const std::exception&) {
      *alive = false;  // refused: the daemon is gone
    }
    const double ms = std::chrono::duration<double, std::milli>(Clock::now() - start).count();
    ++tally.sent;
    tally.slowest_ms = std::max(tally.slowest_ms, ms);
    const int code = CodeOf(answer);
    if (answer.empty() && !kind.answerable && ms < kAnswerWaitMs) {
      ++tally.clean_closes;
    } else if (code > 0) {
      ++tally.error_answers;
    } else {
      ++tally.unexpected;
      fprintf(stderr, "%s: unexpected %s\n", kind.name.c_str(), answer.empty() ? "silence" : answer.substr(0, 200).c_str());
    }
    if ((i + 1) % kinds.size() == 0) *alive = *alive && Alive(socket, good);
  }
  *alive = *alive && Alive(socket, good);
  return tallies;
}

// The extraction worker on one end of a socket pair, as the library starts it.
class Worker {
 public:
  Worker(const std::string& program, const std::string& log) {
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) throw std::runtime_error("socketpair");
    process_ = std::make_unique<ChildProcess>(program, std::vector<std::string>{"--worker"}, log,
                                              std::map<std::string, std::string>{}, ends[1]);
    close(ends[1]);
    socket_ = ends[0];
  }
  ~Worker() { close(socket_); }
  // Sends a descriptor of `file` and the bytes (then shuts the sending side
  // when `cut`); the reply text, "" when none came.
  std::string Ask(const std::string& file, const std::string& bytes, bool cut) {
    const int fd = open(file.c_str(), O_RDONLY | O_CLOEXEC);
    corvlumex::platform::extract::SendDescriptor(socket_, fd);
    close(fd);
    // A refused request is answered before it is all sent: the reply is read all the same.
    for (size_t sent = 0; sent < bytes.size();) {
      const ssize_t n = send(socket_, bytes.data() + sent, bytes.size() - sent, MSG_NOSIGNAL);
      if (n <= 0) break;
      sent += static_cast<size_t>(n);
    }
    if (cut) shutdown(socket_, SHUT_WR);
    std::string reply;
    if (corvlumex::ReadFrameBounded(socket_, 8u << 20, kAnswerWaitMs, kAnswerWaitMs, &reply) !=
        corvlumex::FrameStatus::kOk) {
      return std::string();
    }
    return reply;
  }
  // The exit status once it has ended by itself within `wait_ms`; -1 otherwise.
  int EndedWithin(int wait_ms) {
    if (!corvlumex::testing_support::PollUntil([&] { return !process_->Running(); }, std::chrono::milliseconds(wait_ms))) return -1;
    return process_->exit_status();
  }

 private:
  std::unique_ptr<ChildProcess> process_;
  int socket_ = -1;
};

// The worker reads requests from the library only; a request it cannot read
// whole (cut, or over its 64 KiB bound) ends the conversation, since where
// the next one begins is lost: it must then exit with status 1 at once
// (never crash, spin or hang), and the library starts another.
std::map<std::string, Tally> AttackWorker(const std::string& program, const std::string& work, int frames, bool* alive) {
  constexpr size_t kWorkerRequestBound = 64u << 10;
  const std::string file = work + "/doc.txt";
  FILE* out = fopen(file.c_str(), "w");
  fputs("plain words", out);
  fclose(out);
  const std::string good = R"({"name": ")" + file + R"(", "need_meta": false})";
  std::map<std::string, Tally> tallies;
  const std::vector<Kind> kinds = Kinds("name", good, true);
  const std::string log = work + "/worker.log";
  auto worker = std::make_unique<Worker>(program, log);
  *alive = true;
  for (int i = 0; i < frames && *alive; ++i) {
    const Kind& kind = kinds[i % kinds.size()];
    Tally& tally = tallies[kind.name];
    ++tally.sent;
    const Clock::time_point start = Clock::now();
    const std::string bytes = kind.bytes(i / static_cast<int>(kinds.size()));
    uint32_t length = 0;
    if (bytes.size() >= sizeof(length)) memcpy(&length, bytes.data(), sizeof(length));
    const bool ends_worker = !kind.answerable || length > kWorkerRequestBound;
    const std::string reply = worker->Ask(file, bytes, !kind.answerable);
    const int status = ends_worker ? worker->EndedWithin(kAnswerWaitMs) : 0;
    tally.slowest_ms = std::max(tally.slowest_ms, std::chrono::duration<double, std::milli>(Clock::now() - start).count());
    Json::Value answer;
    const bool error_answer = JsonFromString(answer, reply) && answer.isObject() && !answer["ok"].asBool() && answer["error"].isString();
    if (error_answer && status == (ends_worker ? 1 : 0)) {
      ++tally.error_answers;
    } else if (!kind.answerable && reply.empty() && status == 1) {
      ++tally.clean_closes;
    } else {
      ++tally.unexpected;
      fprintf(stderr, "worker, %s: unexpected %s (exit %d)\n", kind.name.c_str(),
              reply.empty() ? "silence" : reply.substr(0, 200).c_str(), status);
    }
    if (ends_worker) worker = std::make_unique<Worker>(program, log);
    Json::Value served;
    if (!JsonFromString(served, worker->Ask(file, Frame(good), false)) || !served["ok"].asBool()) *alive = false;
  }
  return tallies;
}

void Print(const std::string& target, const std::map<std::string, Tally>& tallies, bool alive) {
  Tally all;
  printf("\n%s\n%-30s %6s %8s %8s %10s %12s\n", target.c_str(), "kind", "sent", "errors", "closes", "unexpected", "slowest ms");
  for (const auto& [name, tally] : tallies) {
    printf("%-30s %6d %8d %8d %10d %12.1f\n", name.c_str(), tally.sent, tally.error_answers, tally.clean_closes, tally.unexpected,
           tally.slowest_ms);
    all.sent += tally.sent;
    all.error_answers += tally.error_answers;
    all.clean_closes += tally.clean_closes;
    all.unexpected += tally.unexpected;
  }
  printf("%-30s %6d %8d %8d %10d\n", "all", all.sent, all.error_answers, all.clean_closes, all.unexpected);
  printf("alive and answering a good request afterwards: %s\n", alive ? "yes" : "NO");
}

}  // namespace

int main(int argc, char** argv) {
  std::string build, work;
  int frames = 1000;
  for (int i = 1; i + 1 < argc; i += 2) {
    const std::string option = argv[i];
    if (option == "--build") build = argv[i + 1];
    if (option == "--work") work = argv[i + 1];
    if (option == "--frames") frames = std::stoi(argv[i + 1]);
  }
  if (build.empty() || work.empty()) {
    fprintf(stderr, "usage: hostile_frames --build BUILD_DIR --work DIR [--frames N]\n");
    return 2;
  }
  signal(SIGPIPE, SIG_IGN);
  const std::map<std::string, std::string> env = {{"CORVLUMEX_ROOT", work}};
  const std::string elastic_socket = work + "/corvelasticd.sock", indexer_socket = work + "/fileindexd.sock";
  ChildProcess elastic(build + "/programs/corvelasticd/corvelasticd", {"--socket", elastic_socket, "--log-stderr"},
                       work + "/corvelasticd.log", env);
  ChildProcess indexer(build + "/programs/fileindexd/fileindexd", {"--socket", indexer_socket, "--log-stderr"},
                       work + "/fileindexd.log", env);
  const std::string elastic_good = R"({"command": "index_list"})", indexer_good = R"({"type": "status"})";
  if (!corvlumex::testing_support::PollUntil([&] { return Alive(elastic_socket, elastic_good) && Alive(indexer_socket, indexer_good); },
                                             std::chrono::seconds(30))) {
    fprintf(stderr, "the daemons did not start; see %s\n", work.c_str());
    return 1;
  }
  // An index, so that searches reach the query parser.
  SendRaw(elastic_socket, Frame(R"({"command": "index_create", "data": {"id": "fileindex_share", "path": ")" + work +
                                R"(/index", "mappings": {"property_id": "CORVMDPath", "properties": {"CORVMDPath": {"analyzer": "keyword"},
                                "CORVMDTextContent": {"type": "text"}}}}})"));
  bool elastic_alive = false, indexer_alive = false, worker_alive = false;
  const auto elastic_tallies = AttackSocket(elastic_socket, "command", elastic_good, frames, &elastic_alive);
  const auto indexer_tallies = AttackSocket(indexer_socket, "type", indexer_good, frames, &indexer_alive);
  const auto worker_tallies = AttackWorker(build + "/programs/corvcontentextractd/corvcontentextractd", work, frames, &worker_alive);
  elastic_alive = elastic_alive && elastic.Running();
  indexer_alive = indexer_alive && indexer.Running();
  Print("corvelasticd (" + elastic_socket + ")", elastic_tallies, elastic_alive);
  Print("fileindexd (" + indexer_socket + ")", indexer_tallies, indexer_alive);
  Print("corvcontentextractd --worker (socket pair)", worker_tallies, worker_alive);
  return elastic_alive && indexer_alive && worker_alive ? 0 : 1;
}

// The small pure parts of corvnotifyd: the queue line text, the crash-marker
// back-off and the monitor-queue configuration files.
#include <gtest/gtest.h>

#include <chrono>
#include <string>
#include <tuple>
#include <vector>

#include "common/json_util.h"
#include "fileindex/queue/event.h"
#include "programs/corvnotifyd/crash_backoff.h"
#include "programs/corvnotifyd/event_line.h"
#include "programs/corvnotifyd/loss_advice.h"
#include "programs/corvnotifyd/monitor_config.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace notifyd {
namespace {

using testing_support::LogCapture;
using testing_support::Sandbox;

// ---- queue lines ----

// Exact JSON on one line, read back byte for byte by the indexer's own line
// parser, awkward names too: quotes, backslashes, a newline, a control byte,
// and bytes that are not UTF-8.
TEST(QueueLineTest, LinesAreExactJsonThatTheIndexerReadsBack) {
  static const char kName[] = "/v/s/q\"b\\n\nt\tc\x01z\xff\xfe\xc3\xa9";
  const struct {
    uint32_t event;
    bool is_dir;
    std::string path, old;
    std::string line;
  } cases[] = {
      {kEventCreate, false, "/v/s/a.txt", "", R"({"event":64,"is_dir":false,"path":"/v/s/a.txt"})"},
      {kEventRename, true, "/v/s/new", "/v/s/old",
       R"({"event":256,"is_dir":true,"path":"/v/s/new","path_old":"/v/s/old"})"},
      {kEventDelete, false, std::string(kName, sizeof(kName) - 1), "/v/s/\x80old",
       "{\"event\":128,\"is_dir\":false,\"path\":\"/v/s/q\\\"b\\\\n\\nt\\tc\\u0001z\xff\xfe\xc3\xa9\","
       "\"path_old\":\"/v/s/\x80old\"}"},
  };
  for (const auto& c : cases) {
    std::string out;
    FormatQueueLine(out, c.event, c.is_dir, c.path, c.old);
    EXPECT_EQ(out, c.line + "\n");
    const fileindex::Event event(c.line);
    EXPECT_EQ(std::tie(event.event, event.is_dir, event.path, event.path_old),
              std::tie(c.event, c.is_dir, c.path, c.old));
    EXPECT_TRUE(event.data.isNull());
  }
}

// ---- back-off of crash markers ----

class CrashBackoffTest : public ::testing::Test {
 protected:
  using Clock = CrashBackoff::Clock;
  static constexpr std::chrono::seconds kBase{10};
  CrashBackoff backoff_{kBase, std::chrono::seconds(60)};
  Clock::time_point t0_ = Clock::now();
  Clock::time_point At(int seconds) const { return t0_ + std::chrono::seconds(seconds); }
};

// The first loss is due at once; losses inside a window wait for its end,
// and each marker doubles the next window, up to the ceiling.
TEST_F(CrashBackoffTest, LossesInsideAWindowWaitForItsEndAndDoubleTheNext) {
  EXPECT_FALSE(backoff_.Pending());
  EXPECT_FALSE(backoff_.NextDue().has_value());
  backoff_.OnLoss(At(0));
  EXPECT_TRUE(backoff_.Due(At(0)));
  backoff_.MarkerWritten(At(0));
  EXPECT_FALSE(backoff_.Pending());
  EXPECT_EQ(backoff_.interval(), kBase);
  backoff_.OnLoss(At(1));
  backoff_.OnLoss(At(2));
  EXPECT_FALSE(backoff_.Due(At(9)));
  EXPECT_EQ(*backoff_.NextDue(), At(10));
  EXPECT_EQ(backoff_.losses(), 2u);
  EXPECT_TRUE(backoff_.Due(At(10)));
  backoff_.MarkerWritten(At(10));
  EXPECT_EQ(backoff_.interval(), std::chrono::seconds(20));
  backoff_.OnLoss(At(11));
  EXPECT_FALSE(backoff_.Due(At(29)));
  backoff_.MarkerWritten(At(30));
  EXPECT_EQ(backoff_.interval(), std::chrono::seconds(40));
  backoff_.OnLoss(At(31));
  backoff_.MarkerWritten(At(70));
  EXPECT_EQ(backoff_.interval(), std::chrono::seconds(60)) << "capped";
}

TEST_F(CrashBackoffTest, AQuietSpellStartsOverFromTheBase) {
  backoff_.OnLoss(At(0));
  backoff_.MarkerWritten(At(0));
  backoff_.OnLoss(At(5));
  backoff_.MarkerWritten(At(10));  // window now 20 s, ends at 30
  backoff_.OnLoss(At(100));        // quiet for longer than a window
  EXPECT_TRUE(backoff_.Due(At(100)));
  backoff_.MarkerWritten(At(100));
  EXPECT_EQ(backoff_.interval(), kBase);
}

// ---- configuration files ----

using testing_support::JsonOf;

// The advice quotes the limit the kernel applied, and proposes a value from
// it; a sysctl raised since is named as such, not as the limit reached.
TEST(LossAdviceTest, QuotesTheLimitInForceAndWhatToDo) {
  struct Case {
    LossKind kind;
    long in_force, now;
    std::vector<std::string> says, never;
  };
  const Case cases[] = {
      {LossKind::kKernelOverflow, 16384, 16384,
       {"overflowed at fs.inotify.max_queued_events=16384,", "sysctl -w fs.inotify.max_queued_events=65536",
        "restart corvnotifyd"},
       {"raised"}},
      {LossKind::kKernelOverflow, 16384, 100000,
       {"overflowed at fs.inotify.max_queued_events=16384,", "raised to 100000 since", "restarted"},
       {"max_queued_events=100000", "sysctl -w"}},
      {LossKind::kKernelOverflow, 16384, 8192, {"max_queued_events=16384,", "=65536"}, {"8192"}},
      {LossKind::kKernelOverflow, -1, -1, {"max_queued_events (value unknown)", "max_queued_events=65536"}, {"-1"}},
      {LossKind::kNoWatches, 8192, 8192,
       {"no inotify watch left at fs.inotify.max_user_watches=8192,", "sysctl -w fs.inotify.max_user_watches=16384"},
       {"raised"}},
      {LossKind::kNoWatches, 8192, 524288, {"max_user_watches=8192,", "raised to 524288 since"}, {"sysctl -w"}},
  };
  for (const Case& c : cases) {
    const std::string advice = LossAdvice(c.kind, c.in_force, c.now);
    for (const std::string& text : c.says) EXPECT_NE(advice.find(text), std::string::npos) << text << " in " << advice;
    for (const std::string& text : c.never) EXPECT_EQ(advice.find(text), std::string::npos) << text << " in " << advice;
  }
}

TEST(MonitorConfigTest, ReadsQueueFoldersMaskAndIgnoreNames) {
  MonitorQueueConfig config;
  std::string error;
  ASSERT_TRUE(ParseMonitorQueue(JsonOf(R"({"queue": "/v/s/@eaDir/q", "application": "fileindex", "type": 1,
      "config": [{"path": "/v/s/a/", "mask": 65478, "ignore": ["@eaDir"]}, {"path": "/v/s/b", "mask": 2}]})"),
                                &config, &error))
      << error;
  EXPECT_EQ(config.queue, "/v/s/@eaDir/q");
  ASSERT_EQ(config.roots.size(), 2u);
  EXPECT_EQ(config.roots[0].path, "/v/s/a");
  EXPECT_EQ(config.roots[0].mask, 65478u);
  EXPECT_EQ(config.roots[0].ignore, std::vector<std::string>{"@eaDir"});
  EXPECT_TRUE(config.roots[1].ignore.empty());
  // Null means no folders.
  ASSERT_TRUE(ParseMonitorQueue(JsonOf(R"({"queue": "/v/s/q", "config": null})"), &config, &error));
  EXPECT_TRUE(config.roots.empty());
}

TEST(MonitorConfigTest, FaultsAreNamed) {
  const std::pair<const char*, const char*> cases[] = {
      {R"([1])", "not a JSON object"},
      {R"({"config": null})", "\"queue\" is not an absolute path"},
      {R"({"queue": "rel/q"})", "\"queue\" is not an absolute path"},
      {R"({"queue": "/q", "config": {}})", "\"config\" is neither null nor an array"},
      {R"({"queue": "/q", "config": [{"path": "x", "mask": 1}]})", "\"config\"[0].\"path\" is not an absolute path"},
      {R"({"queue": "/q", "config": [{"path": "/x", "mask": -1}]})", "\"config\"[0].\"mask\" is not an unsigned"},
      {R"({"queue": "/q", "config": [{"path": "/x", "mask": "2"}]})", "\"config\"[0].\"mask\" is not an unsigned"},
      {R"({"queue": "/q", "config": [{"path": "/x", "mask": 2, "ignore": "@eaDir"}]})", "\"ignore\" is not an array"},
      {R"({"queue": "/q", "config": [{"path": "/x", "mask": 2, "ignore": ["a/b"]}]})", "not an entry name"},
  };
  for (const auto& [text, fault] : cases) {
    MonitorQueueConfig config;
    std::string error;
    EXPECT_FALSE(ParseMonitorQueue(JsonOf(text), &config, &error)) << text;
    EXPECT_NE(error.find(fault), std::string::npos) << text << " gave: " << error;
  }
}

TEST(MonitorConfigTest, FolderLoadSkipsOtherFilesAndKeepsTheLastGoodVersionOfABrokenOne) {
  Sandbox root(false);
  root.WriteFile("fileindex@a.json", R"({"queue": "/v/a/q", "config": [{"path": "/v/a/d", "mask": 2}]})");
  root.WriteFile("fileindex@b.json", R"({"queue": "/v/b/q", "config": null})");
  root.WriteFile("fileindex@c.json.Ab12Cd", R"({"queue": "/half/written"})");  // a writer's temporary file
  root.WriteFile(".hidden.json", R"({"queue": "/hidden"})");
  root.WriteFile("notes.txt", "not a configuration");
  MonitorConfig first = LoadMonitorConfig(root.path(), MonitorConfig());
  ASSERT_EQ(first.size(), 2u);
  EXPECT_EQ(first["fileindex@a.json"].queue, "/v/a/q");
  EXPECT_EQ(first["fileindex@b.json"].queue, "/v/b/q");

  LogCapture log;
  root.WriteFile("fileindex@a.json", "{broken");
  root.WriteFile("fileindex@new.json", R"({"queue": 5})");
  MonitorConfig second = LoadMonitorConfig(root.path(), first);
  EXPECT_EQ(second.size(), 2u);
  EXPECT_EQ(second["fileindex@a.json"], first["fileindex@a.json"]);
  EXPECT_EQ(second.count("fileindex@new.json"), 0u);
  EXPECT_EQ(log.Matching("fileindex@a.json: missing or not valid JSON (keeping its previous contents)").size(), 1u);
  EXPECT_EQ(log.Matching("fileindex@new.json: \"queue\" is not an absolute path").size(), 1u);
}

}  // namespace
}  // namespace notifyd
}  // namespace corvlumex

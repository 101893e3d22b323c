// Services, programs, the SMB Spotlight switch and the notifier's queue
// configuration of the Linux platform.
#include <gtest/gtest.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <map>
#include <memory>
#include <functional>
#include <sstream>
#include <vector>

#include "common/file_util.h"
#include "common/json_util.h"
#include "platform/linux/linux_platform.h"
#include "platform/linux/samba_reload.h"
#include "tests/support/child_process.h"
#include "tests/support/log_capture.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace platform {
namespace {

using testing_support::ReadFileText;
using testing_support::Sandbox;

// Sets an environment variable while alive.
class ScopedEnv {
 public:
  ScopedEnv(const char* name, const std::string& value) : name_(name) { setenv(name, value.c_str(), 1); }
  ~ScopedEnv() { unsetenv(name_); }

 private:
  const char* name_;
};

class ServicesTest : public ::testing::Test {
 protected:
  std::string RequestLog() const { return ReadFileText(root_.path() + "/var/log/corvlumex/service_requests.log"); }
  // A service command that appends its arguments to <root>/asked.
  std::string RecordingCommand(int exit_status) const {
    const std::string script = root_.WriteFile(
        "bin/svc", "#!/bin/sh\necho \"$@\" >> " + root_.path() + "/asked\nexit " + std::to_string(exit_status) + "\n");
    chmod(script.c_str(), 0755);
    return script;
  }

  Sandbox root_;
  LinuxPlatform platform_;
};

// In a sandbox requests are only recorded: what each one becomes
// (start/--no-block stop/reload smbd/unit names) is read back by
// RelatedServicesTest from the same record.
TEST_F(ServicesTest, BadRequestsAreRefused) {
  EXPECT_LT(platform_.ServicectlStart("pkg-CorvLumex-fileindexd", 7), 0);
  EXPECT_LT(platform_.ServiceStart("../etc/passwd", true), 0);
  EXPECT_LT(platform_.ServiceStart("", true), 0);
  EXPECT_EQ(LastError().code, kPlatformErrBadArgument);
  EXPECT_EQ(RequestLog(), "");
}

TEST_F(ServicesTest, TheConfiguredCommandCarriesTheRequest) {
  root_.WriteFile("etc/corvlumex/service_command", RecordingCommand(0) + "\n");
  EXPECT_EQ(platform_.ServiceStart("corvcontentextractd", true), 0);
  EXPECT_EQ(platform_.ServiceRestart("nginx.socket"), 0);
  EXPECT_EQ(ReadFileText(root_.path() + "/asked"), "start corvcontentextractd.service\nrestart nginx.socket\n");
  EXPECT_EQ(RequestLog(), "");

  // The environment wins over the file; a failing command is a failure.
  const std::string failing = RecordingCommand(3);
  ScopedEnv env("CORVLUMEX_SERVICE_COMMAND", failing);
  EXPECT_LT(platform_.ServiceStop("samba", true), 0);
  EXPECT_EQ(LastError().code, kPlatformErrService);
  EXPECT_NE(LastError().message.find("status 3"), std::string::npos) << LastError().message;
}

TEST_F(ServicesTest, SambaIsReloadedNeverRestarted) {
  // With systemd's command (a real host), every smbd process is told to
  // re-read its configuration; a restart would drop every SMB client.
  root_.WriteFile("etc/corvlumex/service_command", "/bin/systemctl\n");
  const std::string smbcontrol = root_.WriteFile("bin/smbcontrol", "#!/bin/sh\necho \"smbcontrol $@\" >> " +
                                                                       root_.path() + "/asked\n");
  chmod(smbcontrol.c_str(), 0755);
  const std::string old_path = getenv("PATH") != nullptr ? getenv("PATH") : "/usr/bin:/bin";
  setenv("PATH", (root_.path() + "/bin:" + old_path).c_str(), 1);
  EXPECT_EQ(platform_.ServiceRestart("samba"), 0);
  setenv("PATH", old_path.c_str(), 1);
  EXPECT_EQ(ReadFileText(root_.path() + "/asked"), "smbcontrol smbd reload-config\n");
  // Through an administrator's own service command it is a reload too.
  ScopedEnv command("CORVLUMEX_SERVICE_COMMAND", RecordingCommand(0));
  EXPECT_EQ(platform_.ServiceRestart("samba"), 0);
  EXPECT_EQ(ReadFileText(root_.path() + "/asked"), "smbcontrol smbd reload-config\nreload smbd.service\n");
}

// Samba's RPC workers (rpcd_mdssvc answers Finder) keep the configuration
// they started with through smbd's reload; only a SIGHUP makes them read it
// again. The stand-ins are copies of the shell that say "up", then wait on
// their input: with a SIGHUP handler (as a running worker has) they say
// "reloaded" when told; without one (a worker still starting) a SIGHUP would
// end them.
TEST_F(ServicesTest, SambaRpcWorkersOfTheConfigurationAreSignalledToReload) {
  namespace fs = std::filesystem;
  const std::string samba = root_.path() + "/libexec/samba";
  const std::string elsewhere = root_.path() + "/home/someone";
  fs::create_directories(samba);
  fs::create_directories(elsewhere);
  fs::copy_file("/bin/sh", samba + "/samba-dcerpcd");
  fs::copy_file("/bin/sh", samba + "/rpcd_mdssvc");
  fs::copy_file("/bin/sh", elsewhere + "/rpcd_mdssvc");  // a user's own program of the same name
  const std::string config = root_.path() + "/smb.conf";
  const std::string handler = "trap 'echo reloaded' HUP; ";
  int input[2];
  ASSERT_EQ(pipe2(input, O_CLOEXEC), 0);  // only the workers' standard input stays open in them
  const struct {
    std::string program;
    std::string config;
    std::string script;
    std::string said;
  } cases[] = {
      {samba + "/rpcd_mdssvc", config, handler, "up\nreloaded\n"},
      {samba + "/rpcd_mdssvc", root_.path() + "/another.conf", handler, "up\n"},
      {samba + "/rpcd_mdssvc", config, "", "up\n"},
      {elsewhere + "/rpcd_mdssvc", config, handler, "up\n"},
  };
  std::vector<std::unique_ptr<testing_support::ChildProcess>> workers;
  std::vector<std::string> logs;
  for (const auto& worker : cases) {
    logs.push_back(root_.path() + "/worker" + std::to_string(logs.size()) + ".log");
    workers.push_back(std::make_unique<testing_support::ChildProcess>(
        worker.program,
        std::vector<std::string>{"-c", worker.script + "echo up; read line; read line; true", "rpcd_mdssvc",
                                 "--configfile=" + worker.config},
        logs.back(), std::map<std::string, std::string>{}, input[0]));
  }
  close(input[0]);
  for (const std::string& log : logs) {
    ASSERT_TRUE(testing_support::PollUntil([&] { return testing_support::ReadFileText(log) == "up\n"; },
                                           std::chrono::seconds(30)))
        << log;
  }
  EXPECT_EQ(SambaRpcWorkers(config).size(), 2u);
  EXPECT_EQ(ReloadSambaRpcWorkers(config), 1u);
  close(input[1]);
  for (size_t i = 0; i < workers.size(); ++i) {
    EXPECT_EQ(workers[i]->Wait(), 0) << cases[i].program;
    EXPECT_EQ(testing_support::ReadFileText(logs[i]), cases[i].said) << i;
  }
}

TEST_F(ServicesTest, ExecRunsWithoutAShell) {
  const std::string odd_name = root_.path() + "/a b; rm -rf $HOME";
  EXPECT_EQ(platform_.Exec("/usr/bin/touch", {odd_name}, kExecDefault), 0);
  EXPECT_TRUE(IsFileExist(odd_name));
  EXPECT_EQ(platform_.Exec("/bin/false", {}, kExecDefault), 1);
  EXPECT_EQ(LastError().code, kPlatformErrExec);
  EXPECT_EQ(platform_.Exec("touch", {root_.path() + "/found"}, kExecDefault | kExecSearchPath), 0);
  EXPECT_TRUE(IsFileExist(root_.path() + "/found"));
  EXPECT_LT(platform_.Exec("touch", {root_.path() + "/nope"}, kExecDefault), 0);  // no PATH search asked for
  EXPECT_LT(platform_.Exec(root_.path() + "/missing", {}, kExecDefault), 0);
  EXPECT_NE(LastError().message.find("No such file"), std::string::npos) << LastError().message;
  EXPECT_LT(platform_.Exec("/bin/sh", {"-c", "kill -9 $$"}, kExecDefault), 0);
  EXPECT_NE(LastError().message.find("signal 9"), std::string::npos) << LastError().message;
  EXPECT_LT(platform_.Exec("", {}, kExecDefault), 0);
  // Not waited for: started is success, a program that cannot start is still reported.
  EXPECT_EQ(platform_.Exec("/bin/true", {}, kExecNullStdin | kExecNewSession | 0xBA), 0);
  EXPECT_LT(platform_.Exec(root_.path() + "/missing", {}, kExecNullStdin), 0);
}

TEST_F(ServicesTest, ExecClosesDescriptorsAndSilencesOutputWhenAsked) {
  const std::string out = root_.path() + "/out";
  const std::string script = root_.WriteFile("bin/fds", "#!/bin/sh\nls /proc/self/fd > " + out + "\necho noise\n");
  chmod(script.c_str(), 0755);
  // A descriptor the parent left inheritable must not reach the program.
  // (Far above the descriptor ls opens for its own listing.)
  const int opened = open("/dev/null", O_RDONLY);
  const int inherited = fcntl(opened, F_DUPFD, 100);
  close(opened);
  ASSERT_GE(inherited, 100);
  // Whether the program saw the inherited descriptor, after running with `flags`.
  const auto inherited_seen = [&](int flags) {
    EXPECT_EQ(platform_.Exec(script, {}, kExecWait | flags), 0);
    std::istringstream listing(ReadFileText(out));
    std::vector<std::string> fds;
    for (std::string fd; listing >> fd;) fds.push_back(fd);
    EXPECT_FALSE(fds.empty());
    return std::count(fds.begin(), fds.end(), std::to_string(inherited)) == 1;
  };
  EXPECT_FALSE(inherited_seen(kExecCloseFds | kExecNullStdout | kExecNullStderr));
  EXPECT_TRUE(inherited_seen(kExecNullStdout));  // kept when not asked
  close(inherited);
}

TEST_F(ServicesTest, SpotlightIsASambaIncludeFile) {
  EXPECT_EQ(platform_.SMBIsEnableSpotlight(), 0);
  ASSERT_EQ(platform_.SMBSetSpotlight(true), 0);
  const std::string include = root_.path() + "/etc/samba/corvlumex-spotlight.conf";
  EXPECT_NE(ReadFileText(include).find("[global]\n\tspotlight backend = elasticsearch\n"), std::string::npos);
  EXPECT_EQ(platform_.SMBIsEnableSpotlight(), 1);
  // The indexed shares, with their index names; a change is reported once.
  EXPECT_EQ(platform_.SMBSetSpotlightShares({"photo", "music", "a]b"}), 1);
  EXPECT_EQ(platform_.SMBSetSpotlightShares({"music", "photo"}), 0);
  EXPECT_NE(ReadFileText(include).find("[photo]\n\tspotlight = yes\n\tspotlight backend = elasticsearch\n"
                                  "\telasticsearch:index = fileindex_photo\n"),
            std::string::npos);
  EXPECT_EQ(ReadFileText(include).find("a]b"), std::string::npos);
  // Off keeps the shares, with Spotlight off there too.
  ASSERT_EQ(platform_.SMBSetSpotlight(false), 0);
  EXPECT_EQ(platform_.SMBIsEnableSpotlight(), 0);
  EXPECT_NE(ReadFileText(include).find("[music]\n\tspotlight = no\n"), std::string::npos);
  ASSERT_EQ(platform_.SMBSetSpotlight(true), 0);
  EXPECT_NE(ReadFileText(include).find("[music]\n\tspotlight = yes\n"), std::string::npos);
}

class MonitorQueueTest : public ServicesTest {
 protected:
  std::string ConfigFile() const {
    return root_.path() + "/etc/corvlumex/monitor.d/fileindex@%2Fvolume1%2Fphoto%2F%40eaDir%2Ffileindex.queue.json";
  }
  Json::Value Queue() const {
    return testing_support::JsonOf(R"({"queue":"/volume1/photo/@eaDir/fileindex.queue",)"
                                   R"("config":[{"path":"/volume1/photo/2019","mask":65478,"ignore":["@eaDir"]}]})");
  }
};

TEST_F(MonitorQueueTest, UpsertWritesOneFilePerQueueAndDeleteRemovesIt) {
  ASSERT_TRUE(platform_.MonitorQueueUpsert(Queue(), "fileindex", kMonitorQueueTypeApplication));
  Json::Value written;
  ASSERT_TRUE(JsonFromFile(written, ConfigFile()));
  EXPECT_EQ(JsonToString(written), R"({"application":"fileindex","config":[{"ignore":["@eaDir"],"mask":65478,)"
                                   R"("path":"/volume1/photo/2019"}],"queue":"/volume1/photo/@eaDir/fileindex.queue",)"
                                   R"("type":1})");

  // Replaced whole; a share without folders keeps its queue with a null config.
  Json::Value empty = Queue();
  empty["config"] = Json::Value();
  ASSERT_TRUE(platform_.MonitorQueueUpsert(empty, "fileindex", kMonitorQueueTypeApplication));
  ASSERT_TRUE(JsonFromFile(written, ConfigFile()));
  EXPECT_EQ(JsonToString(written),
            R"({"application":"fileindex","config":null,"queue":"/volume1/photo/@eaDir/fileindex.queue","type":1})");

  ASSERT_TRUE(platform_.MonitorQueueDelete(Queue()["queue"].asString(), "fileindex", kMonitorQueueTypeApplication));
  EXPECT_FALSE(IsFileExist(ConfigFile()));
  EXPECT_TRUE(platform_.MonitorQueueDelete(Queue()["queue"].asString(), "fileindex", kMonitorQueueTypeApplication));
}

TEST_F(MonitorQueueTest, QueuesWithSimilarPathsGetTheirOwnFiles) {
  Json::Value a = Queue(), b = Queue();
  a["queue"] = "/v/a_b/q";
  b["queue"] = "/v/a/b_q";
  ASSERT_TRUE(platform_.MonitorQueueUpsert(a, "fileindex", kMonitorQueueTypeApplication));
  ASSERT_TRUE(platform_.MonitorQueueUpsert(b, "fileindex", kMonitorQueueTypeApplication));
  Json::Value long_path = Queue();
  long_path["queue"] = "/v/" + std::string(300, 'x') + "/q";
  ASSERT_TRUE(platform_.MonitorQueueUpsert(long_path, "fileindex", kMonitorQueueTypeApplication));
  int files = 0;
  for (const char* name : {"fileindex@%2Fv%2Fa_b%2Fq.json", "fileindex@%2Fv%2Fa%2Fb_q.json"}) {
    files += IsFileExist(root_.path() + "/etc/corvlumex/monitor.d/" + name);
  }
  EXPECT_EQ(files, 2);
}

TEST_F(MonitorQueueTest, MalformedConfigurationsAreRefused) {
  const std::function<void(Json::Value&)> spoilers[] = {
      [](Json::Value& q) { q.removeMember("queue"); },
      [](Json::Value& q) { q["queue"] = "relative/queue"; },
      [](Json::Value& q) { q["config"] = Json::Value(Json::objectValue); },
      [](Json::Value& q) { q["config"][0]["mask"] = "all"; },  // last: its message is checked
  };
  for (const auto& spoil : spoilers) {
    Json::Value bad = Queue();
    spoil(bad);
    EXPECT_FALSE(platform_.MonitorQueueUpsert(bad, "fileindex", kMonitorQueueTypeApplication)) << bad;
  }
  EXPECT_NE(LastError().message.find("\"mask\""), std::string::npos);
  EXPECT_FALSE(platform_.MonitorQueueUpsert(Queue(), "", kMonitorQueueTypeApplication));
  EXPECT_FALSE(platform_.MonitorQueueUpsert(Queue(), "../x", kMonitorQueueTypeApplication));
  EXPECT_FALSE(platform_.MonitorQueueUpsert(Queue(), "fileindex", 2));
  EXPECT_FALSE(platform_.MonitorQueueDelete("relative", "fileindex", kMonitorQueueTypeApplication));
  EXPECT_FALSE(IsDirExist(root_.path() + "/etc/corvlumex/monitor.d", false));
}

}  // namespace
}  // namespace platform
}  // namespace corvlumex

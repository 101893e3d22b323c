// End to end with the real Samba: smbd with its own configuration over the
// sandbox share, in a private network namespace, asks corvspotlightd, which
// answers from the index the real daemons built; Samba's own client
// `mdsearch` must print exactly the paths a scan of the tree gives.
//
// Needs root (a private network namespace, a system user for Samba, smbd),
// and Debian's samba and smbclient packages; skipped otherwise.
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <netinet/in.h>
#include <arpa/inet.h>
#include <signal.h>
#include <unistd.h>

#include <cstdlib>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <memory>
#include <set>
#include <sstream>
#include <string>

#include "common/sys.h"
#include "platform/linux/samba_reload.h"
#include "platform/platform.h"
#include "tests/support/child_process.h"
#include "tests/system/system_harness.h"

namespace corvlumex {
namespace testing_support {
namespace {

namespace fs = std::filesystem;

constexpr char kPassword[] = "Spotl1ght-test";

// The shell's output of `command` (stderr too), and its exit status.
int RunShell(const std::string& command, std::string* output = nullptr) {
  FILE* pipe = popen((command + " 2>&1").c_str(), "r");
  if (pipe == nullptr) return -1;
  std::string text;
  char buffer[4096];
  size_t got;
  while ((got = fread(buffer, 1, sizeof(buffer), pipe)) > 0) text.append(buffer, got);
  const int status = pclose(pipe);
  if (output != nullptr) *output = text;
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

bool Listening(int port) {
  const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(static_cast<uint16_t>(port));
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  const bool connected = connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0;
  close(fd);
  return connected;
}

class SpotlightSambaTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (geteuid() != 0) GTEST_SKIP() << "needs root: a private network namespace, a system user and smbd";
    for (const char* tool : {"/usr/sbin/smbd", "/usr/bin/mdsearch", "/usr/bin/smbpasswd", "/usr/sbin/useradd"}) {
      if (access(tool, X_OK) != 0) GTEST_SKIP() << tool << " is missing (scripts/bootstrap installs samba and smbclient)";
    }
    // Only this test process and what it starts see the private loopback.
    ASSERT_EQ(unshare(CLONE_NEWNET), 0) << "unshare(CLONE_NEWNET) failed";
    ASSERT_EQ(RunShell("ip link set lo up"), 0);
    user_ = "corvspot" + std::to_string(getpid());
    std::string output;
    ASSERT_EQ(RunShell("useradd --system --no-create-home --shell /usr/sbin/nologin " + user_, &output), 0) << output;
    user_made_ = true;
    sandbox_ = std::make_unique<SystemSandbox>();
    // The share's volume is a private temporary folder: the SMB user must reach it.
    chmod(fs::path(sandbox_->share_dir()).parent_path().c_str(), 0755);
    chmod(sandbox_->share_dir().c_str(), 0755);
  }

  void TearDown() override {
    if (HasFailure() && spotlightd_) {
      std::string samba_logs;
      RunShell("grep -h -i -A2 'mds\\|elastic\\|http' " + sandbox_->root() + "/samba/log/* | tail -n 100", &samba_logs);
      std::string client;
      RunShell("mdsearch -d 5 --configfile=" + config_ + " -U " + user_ + "%" + kPassword +
                   " //127.0.0.1 share 'kMDItemFSName==\"report*\"' | tail -n 60",
               &client);
      ADD_FAILURE() << "mdsearch:\n" << client << "corvspotlightd:\n" << spotlightd_->Log() << "samba:\n" << samba_logs;
    }
    if (smbd_) {
      smbd_->Stop(SIGTERM);
      // samba-dcerpcd and its rpcd workers run in a session of their own and
      // outlive smbd: they are ended through their process group.
      for (const char* helper : {"samba-dcerpcd", "smbd"}) {
        const std::string pid = ReadFileText(sandbox_->root() + "/samba/pid/" + helper + ".pid");
        if (atoi(pid.c_str()) > 1) kill(-atoi(pid.c_str()), SIGTERM);
      }
    }
    spotlightd_.reset();
    sandbox_.reset();
    if (user_made_) RunShell("userdel " + user_);
  }

  void WriteFile(const std::string& relative, const std::string& text, time_t mtime = 0) {
    const std::string path = sandbox_->Path(relative);
    fs::create_directories(fs::path(path).parent_path());
    WriteText(path, text);
    if (mtime != 0) {
      const timeval times[2] = {{mtime, 0}, {mtime, 0}};
      utimes(path.c_str(), times);
    }
  }

  void StartSamba() {
    const std::string dir = sandbox_->root() + "/samba";
    for (const char* sub : {"private", "lock", "state", "cache", "pid", "ncalrpc", "log"}) {
      fs::create_directories(dir + "/" + sub);
    }
    config_ = dir + "/smb.conf";
    // The sandbox's Spotlight include is what the switch wrote; only the
    // mappings' place differs in a build tree, and mdsearch 4.17 prints
    // results only when the whole search fits in its first answer.
    WriteText(config_,
              "[global]\n"
              "\tnetbios name = CORVSPOTTEST\n"
              "\tserver role = standalone server\n"
              "\tinterfaces = lo\n\tbind interfaces only = yes\n"
              "\tprivate dir = " + dir + "/private\n"
              "\tlock directory = " + dir + "/lock\n"
              "\tstate directory = " + dir + "/state\n"
              "\tcache directory = " + dir + "/cache\n"
              "\tpid directory = " + dir + "/pid\n"
              "\tncalrpc dir = " + dir + "/ncalrpc\n"
              "\tlog file = " + dir + "/log/samba.log\n\tmax log size = 0\n"
              "\tlog level = 1 rpc_srv:10\n"
              "\tpassdb backend = tdbsam\n"
              "\tload printers = no\n\tprinting = bsd\n\tprintcap name = /dev/null\n\tdisable spoolss = yes\n"
              "[share]\n"
              "\tpath = " + sandbox_->share_dir() + "\n"
              "\tread only = yes\n"
              "include = " + sandbox_->root() + "/etc/samba/corvlumex-spotlight.conf\n"
              "[global]\n"
              "\telasticsearch:mappings = " FILEINDEX_SOURCE_DIR "/programs/corvspotlightd/spotlight_mappings.json\n"
              "\telasticsearch:max results = 50\n");
    std::string output;
    ASSERT_EQ(RunShell("printf '%s\\n%s\\n' '" + std::string(kPassword) + "' '" + kPassword + "' | smbpasswd -c " +
                           config_ + " -a -s " + user_,
                       &output),
              0)
        << output;
    // smbd and its helpers signal their whole process group when they end:
    // a session of their own keeps that away from the test.
    smbd_ = std::make_unique<ChildProcess>(
        "/usr/bin/setsid",
        std::vector<std::string>{"/usr/sbin/smbd", "-F", "--no-process-group", "--debug-stdout", "-s", config_},
        dir + "/log/smbd.out");
    ASSERT_TRUE(PollUntil([] { return Listening(445); }, std::chrono::seconds(30))) << smbd_->Log();
  }

  // mdsearch's paths, share-relative, or the failure.
  std::set<std::string> MdSearch(const std::string& query) {
    std::string output;
    const int status = RunShell("mdsearch --configfile=" + config_ + " -U " + user_ + "%" + kPassword +
                                    " //127.0.0.1 share '" + query + "'",
                                &output);
    EXPECT_EQ(status, 0) << query << ": " << output << "\n" << spotlightd_->Log();
    std::set<std::string> paths;
    std::istringstream lines(output);
    std::string line;
    while (std::getline(lines, line)) {
      if (!line.empty()) paths.insert(line);
    }
    return paths;
  }

  std::string user_;
  bool user_made_ = false;
  std::unique_ptr<SystemSandbox> sandbox_;
  std::unique_ptr<ChildProcess> spotlightd_;
  std::unique_ptr<ChildProcess> smbd_;
  std::string config_;
};

TEST_F(SpotlightSambaTest, MdsearchFindsWhatAScanOfTheTreeFinds) {
  const time_t old = 1546300800;  // 2019-01-01
  WriteFile("Report 2023.pdf.txt", "quarterly figures of the lighthouse keepers\n");
  WriteFile("reports/annual report.txt", "a long year of portraits and harbour lights\n", old);
  WriteFile("reports/notes.md", "passport renewal checklist\n");
  WriteFile("music/ferry song.txt", "the ferry leaves at noon from the lighthouse pier\n", old);
  WriteFile("photos/large.txt", std::string(6000, 'x') + "\n");
  WriteFile("photos/Port Louis.txt", "saffron rice recipe\n");
  WriteFile("empty folder/readme", "plain words without an extension\n");
  sandbox_->StartAll();
  sandbox_->AddFolder("");
  ASSERT_EQ(sandbox_->Converge(sandbox_->DiskPaths("")), "");
  // The switch the folder add made: on, with this share.
  ASSERT_EQ(platform::Current()->SMBIsEnableSpotlight(), 1);

  spotlightd_ = std::make_unique<ChildProcess>(ProgramPath("corvspotlightd"), std::vector<std::string>{"--log-stderr"},
                                               sandbox_->root() + "/corvspotlightd.log");
  ASSERT_TRUE(PollUntil([] { return Listening(platform::kSpotlightResponderPort); }, std::chrono::seconds(20)))
      << spotlightd_->Log();
  StartSamba();

  // What a look at the tree gives (names, words, sizes, dates, types): the
  // shapes of every query Samba writes are query_translator_test's, what
  // each clause finds is corvelasticd's corpus_scan_test; here, that the
  // real Samba reaches the real daemons and prints exactly these paths.
  using Paths = std::set<std::string>;
  const Paths reports = {"Report 2023.pdf.txt", "reports"};
  const Paths port = {"Report 2023.pdf.txt", "reports", "reports/annual report.txt",
                      "photos/Port Louis.txt"};
  const struct {
    const char* query;
    Paths expected;
  } cases[] = {
      {"kMDItemFSName==\"report*\"", reports},
      {"kMDItemDisplayName==\"*port*\"", port},
      {"*==\"port*\"", port},  // "portraits" is in a file already named so
      {"kMDItemTextContent==\"lighthouse\"", {"Report 2023.pdf.txt", "music/ferry song.txt"}},
      {"kMDItemFSName==\"*.md\"", {"reports/notes.md"}},
      {"kMDItemFSSize>\"5000\"", {"photos/large.txt"}},
      {"kMDItemFSContentChangeDate<$time.iso(2020-01-01T00:00:00Z)",
       {"reports/annual report.txt", "music/ferry song.txt"}},
      {"kMDItemContentType==\"public.plain-text\"",
       {"Report 2023.pdf.txt", "reports/annual report.txt", "reports/notes.md",
        "music/ferry song.txt", "photos/large.txt", "photos/Port Louis.txt",
        "empty folder/readme"}},
      {"kMDItemTextContent==\"harbour lights\"", {"reports/annual report.txt"}},
      {"kMDItemTextContent==\"lighthouse\"&&kMDItemFSContentChangeDate<$time.iso(2020-01-01T00:00:00Z)",
       {"music/ferry song.txt"}},
  };
  for (const auto& test : cases) EXPECT_EQ(MdSearch(test.query), test.expected) << test.query;

  // The switch off and on again, each time with a reload: a client connected
  // all along keeps its session (a restart would have dropped it).
  const std::string held_output = sandbox_->root() + "/held-client.out";
  FILE* held = popen(("smbclient --configfile=" + config_ + " -U " + user_ + "%" + kPassword +
                      " //127.0.0.1/share > " + held_output + " 2>&1").c_str(),
                     "w");
  ASSERT_NE(held, nullptr);
  ASSERT_TRUE(PollUntil(
      [&] {
        std::string sessions;
        RunShell("smbstatus --configfile=" + config_ + " -b", &sessions);
        return sessions.find(user_) != std::string::npos;
      },
      std::chrono::seconds(20)));
  // The product's own reload, told this Samba's configuration file.
  const auto reload = [&] { return platform::ReloadSamba(platform::Current().get(), config_); };
  const std::string name_query = "kMDItemFSName==\"report*\"";
  const std::set<std::string> named = MdSearch(name_query);
  ASSERT_EQ(platform::Current()->SMBSetSpotlight(false), 0) << platform::LastError().message;
  ASSERT_EQ(reload(), 0) << platform::LastError().message;
  std::string refused;
  RunShell("mdsearch --configfile=" + config_ + " -U " + user_ + "%" + kPassword + " //127.0.0.1 share '" +
               name_query + "'",
           &refused);
  for (const std::string& path : named) EXPECT_EQ(refused.find(path), std::string::npos) << refused;
  ASSERT_EQ(platform::Current()->SMBSetSpotlight(true), 0) << platform::LastError().message;
  ASSERT_EQ(reload(), 0) << platform::LastError().message;
  EXPECT_EQ(MdSearch(name_query), named);
  fputs("ls\nexit\n", held);
  EXPECT_EQ(pclose(held), 0) << ReadFileText(held_output);
  EXPECT_NE(ReadFileText(held_output).find("Report 2023.pdf.txt"), std::string::npos) << ReadFileText(held_output);
}

}  // namespace
}  // namespace testing_support
}  // namespace corvlumex

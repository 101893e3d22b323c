// The index commands against the real corvelasticd, started on a private
// socket in a sandbox root: what a share's index holds after each command,
// the folder rename among them exactly as the library sends it.
#include <gtest/gtest.h>
#include <unistd.h>

#include <memory>
#include <string>
#include <vector>

#include "common/file_util.h"
#include "common/sys.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/daemon_codes.h"
#include "fileindex/elastic/elastic_control.h"
#include "platform/linux/linux_platform.h"
#include "tests/corvelasticd/daemon_harness.h"
#include "tests/elastic/fake_search_daemon.h"
#include "tests/support/log_capture.h"

namespace corvlumex {
namespace fileindex {
namespace elastic {
namespace {

// The file-system fields only: what a file holds is not the point here.
class NameOnlyPlatform : public platform::LinuxPlatform {
 public:
  void ParseFile(const std::string& path, const Json::Value&, Json::Value& document) override {
    document = Json::Value(Json::objectValue);
    document["CORVMDPath"] = path;
    document["CORVMDParent"] = Dirname(path);
    document["CORVMDFSName"] = Basename(path);
  }
};

class ElasticDaemonTest : public ::testing::Test {
 protected:
  ElasticDaemonTest() : daemon_(root_.path()) {
    share_ = root_.MakeDir("volume1/music");
    root_.WriteFile("etc/corvlumex/shares.json", R"([{"name": "music", "path": ")" + share_ + R"("}])");
    platform::Install(std::make_shared<NameOnlyPlatform>());
    daemon_.Start();
    // The library finds the daemon at the system's socket path.
    root_.MakeDir("var/run");
    if (symlink(daemon_.socket_path().c_str(), ElasticSocketPath().c_str()) != 0) ADD_FAILURE() << "symlink";
  }
  ~ElasticDaemonTest() override { platform::Install(nullptr); }

  std::vector<std::string> Below(const std::string& folder) {
    std::vector<std::string> paths;
    IndexGetByPrefixPath("music", folder, paths);
    return paths;
  }

  testing_support::SandboxRoot root_;
  testing_support::LogCapture log_;
  elasticd_test::Daemon daemon_;
  std::string share_;
};

TEST_F(ElasticDaemonTest, DocumentsFollowUpsertsRenamesAndDeletes) {
  ShareIndexCreate("music");
  // Folders are documents too: a rename starts with the folder's own.
  for (const char* name : {"/a", "/a/x.mp3", "/a/sub", "/a/sub/y.mp3", "/a2", "/a2/z.mp3"}) {
    IndexUpsert("music", share_ + name, false);
  }
  IndexCommit("music");
  EXPECT_EQ(Below(share_ + "/a"),
            (std::vector<std::string>{share_ + "/a/sub", share_ + "/a/sub/y.mp3", share_ + "/a/x.mp3"}))
      << "the sibling a2 is not below a";

  IndexRename("music", share_ + "/a", share_ + "/b");
  IndexCommit("music");
  EXPECT_TRUE(Below(share_ + "/a").empty());
  EXPECT_EQ(Below(share_ + "/b"),
            (std::vector<std::string>{share_ + "/b/sub", share_ + "/b/sub/y.mp3", share_ + "/b/x.mp3"}));

  // A folder's delete leaves the sibling whose name it begins.
  IndexDelDir("music", share_ + "/a");
  IndexCommit("music");
  EXPECT_EQ(Below(share_ + "/a2"), std::vector<std::string>{share_ + "/a2/z.mp3"});
  IndexDelDir("music", share_ + "/b");
  IndexDel("music", share_ + "/a2/z.mp3");
  IndexCommit("music");
  EXPECT_TRUE(Below(share_ + "/b").empty());
  EXPECT_TRUE(Below(share_ + "/a2").empty());

  ShareIndexDelete("music");
  EXPECT_EQ(testing_support::ErrorOrNone([] { IndexCommit("music"); }).code, elasticd::kCodeIndexNotFound) << "no such index";
}

}  // namespace
}  // namespace elastic
}  // namespace fileindex
}  // namespace corvlumex

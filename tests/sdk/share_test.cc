// sdk::SDKShare over the Linux platform and over platforms that fail.
#include <gtest/gtest.h>

#include "common/error.h"
#include "sdk/share.h"
#include "tests/platform/share_sandbox.h"
#include "tests/support/expect_error.h"

namespace corvlumex {
namespace sdk {
namespace {

using platform::LinuxPlatform;
using platform::ShareInfo;
using testing_support::ExpectError;
using testing_support::ScopedPlatform;
using testing_support::ShareSandbox;

// Every share query fails, as a broken platform library would.
class FailingSharePlatform : public LinuxPlatform {
 public:
  int hide_value = 1;
  int hide_result = 0;
  bool fail_alloc = false;
  bool encrypted_answers = false;  // then the read-only check is the one that fails

  int ShareIsEncryptedGet(const ShareInfo& share, int* value) override {
    return encrypted_answers ? LinuxPlatform::ShareIsEncryptedGet(share, value) : -1;
  }
  int ShareIsReadOnlyGet(const ShareInfo&, int*) override { return -1; }
  int ShareIsEncryptionGet(const ShareInfo&, int*) override { return -1; }
  int ShareRecycleStatusGet(const ShareInfo&, int*) override { return -1; }
  int ShareHideUnreadableGet(const ShareInfo&, int* value) override {
    *value = hide_value;
    return hide_result;
  }
  int QueuePathCompose(const char*, char*, size_t) override { return -1; }
  int DBPathCompose(const char*, char*, size_t) override { return -1; }
  int GetIndexID(const char*, char*, size_t) override { return -1; }
  std::unique_ptr<platform::StringList> StringListAlloc(size_t capacity) override {
    return fail_alloc ? nullptr : LinuxPlatform::StringListAlloc(capacity);
  }
  int ShareEnum(platform::StringList*, int) override { return -1; }
};

// Reports the given answer and platform error for every space question.
class SpacePlatform : public LinuxPlatform {
 public:
  SpacePlatform(int answer, int error) : answer_(answer), error_(error) {}
  int QuotaIsEnough(uid_t uid, const std::string& path, uint64_t size) override {
    EXPECT_EQ(uid, 0u);
    EXPECT_EQ(size, 104857600u);
    last_path = path;
    platform::SetLastError(error_, "test", 1, "");
    return answer_;
  }
  std::string last_path;

 private:
  int answer_;
  int error_;
};

class SDKShareTest : public ::testing::Test {
 protected:
  ShareSandbox sandbox_;
};

TEST_F(SDKShareTest, UnknownShareIs800) {
  sandbox_.AddShare("photo");
  ExpectError([] { SDKShare share("video"); }, kErrorShareNotFound, "",
              "0 > CORVShareGet(share_name.c_str(), &share_info_) || !share_info_");
  sandbox_.WriteRegistryText("not json");
  EXPECT_THROW(SDKShare share("photo"), Error);
}

TEST_F(SDKShareTest, IndexableOnlyWhenNeitherEncryptedNorReadOnly) {
  const std::string photo = sandbox_.AddShare("photo");
  Json::Value flags;
  flags["readonly"] = true;
  sandbox_.AddShare("archive", flags);
  flags = Json::Value();
  flags["encrypted"] = true;
  flags["recycle_bin"] = true;
  sandbox_.AddShare("secret", flags);
  flags["readonly"] = true;
  sandbox_.AddShare("both", flags);

  const SDKShare share("photo");
  EXPECT_TRUE(share.CanBeIndexed());
  EXPECT_FALSE(share.IsEncryption());
  EXPECT_FALSE(share.IsEnableRecycleBin());
  EXPECT_FALSE(share.IsHideUnReadable());
  EXPECT_EQ(share.GetName(), "photo");
  EXPECT_EQ(share.GetPath(), photo);
  EXPECT_EQ(share.GetQueuePath(), photo + "/@eaDir/fileindex.queue");
  EXPECT_EQ(share.GetDBPath(), photo + "/@eaDir/fileindex.db");
  EXPECT_EQ(share.GetDBName(), "fileindex_photo");
  EXPECT_FALSE(SDKShare("archive").CanBeIndexed());
  EXPECT_FALSE(SDKShare("secret").CanBeIndexed());
  EXPECT_TRUE(SDKShare("secret").IsEncryption());
  EXPECT_TRUE(SDKShare("secret").IsEnableRecycleBin());
  EXPECT_FALSE(SDKShare("both").CanBeIndexed());
}

TEST_F(SDKShareTest, PrivilegesComeFromThePlatformUnchanged) {
  Json::Value extra;
  extra["ftp_privilege"] = platform::kFtpPrivNoUpload;
  extra["privileges"]["nobody"] = "ro";
  sandbox_.AddShare("photo", extra);
  const SDKShare share("photo");
  EXPECT_EQ(share.GetFTPPrivilege(), static_cast<uint32_t>(platform::kFtpPrivNoUpload));
  EXPECT_EQ(share.GetPrivilege("nobody"), platform::kSharePrivReadOnly);
  EXPECT_LT(share.GetPrivilege("no-such-user-here"), 0);
}

TEST_F(SDKShareTest, EnumIsSorted) {
  EXPECT_TRUE(SDKShare::Enum().empty());
  for (const char* name : {"video", "Music", "photo", "homes"}) sandbox_.AddShare(name);
  EXPECT_EQ(SDKShare::Enum(), (std::set<std::string>{"Music", "homes", "photo", "video"}));
}

TEST_F(SDKShareTest, FailedQueriesAre502WithTheirReasons) {
  sandbox_.AddShare("photo");
  auto failing = std::make_shared<FailingSharePlatform>();
  ScopedPlatform installed(failing);
  const SDKShare share("photo");
  ExpectError([&] { share.CanBeIndexed(); }, kErrorSystem, "KLIBShareis_encryptedGet failed, share=photo",
              "0 > KLIBShareIsEncryptedGet(share_info_, &is_encrypted)");
  failing->encrypted_answers = true;
  ExpectError([&] { share.CanBeIndexed(); }, kErrorSystem, "KLIBShareis_readonlyGet failed, share=photo",
              "0 > KLIBShareIsReadOnlyGet(share_info_, &is_readonly)");
  ExpectError([&] { share.IsEncryption(); }, kErrorSystem, "KLIBShareIsEncryptionGet failed, share=photo",
              "0 > KLIBShareIsEncryptionGet(share_info_, &is_encryption)");
  ExpectError([&] { share.IsEnableRecycleBin(); }, kErrorSystem, "KLIBShareRecycleStatusGet failed, share=photo",
              "0 > KLIBShareRecycleStatusGet(share_info_, &is_enabled)");
  ExpectError([&] { share.GetQueuePath(); }, kErrorSystem, "FILEIDXQueuePathCompose failed, share=photo",
              "0 > FILEIDXQueuePathCompose(share_info_->szPath, path, sizeof(path))");
  ExpectError([&] { share.GetDBPath(); }, kErrorSystem, "FILEIDXDBPathCompose failed, share=photo",
              "0 > FILEIDXDBPathCompose(share_info_->szPath, path, sizeof(path))");
  ExpectError([&] { share.GetDBName(); }, kErrorSystem, "FILEIDXGetIndexID failed, share=photo",
              "0 > FILEIDXGetIndexID(share_info_->szName, name, sizeof(name))");
  ExpectError([] { SDKShare::Enum(); }, kErrorShareEnum, "KLIBShareEnum failed",
              "0 > KLIBShareEnum(&share_list, &enum_func)");
  failing->fail_alloc = true;
  ExpectError([] { SDKShare::Enum(); }, kErrorShareEnum, "", "nullptr == (share_list = KLIBCSzListAlloc(BUFSIZ))");

  // Hide-unreadable never throws: only a successful exact 1 is true.
  EXPECT_TRUE(share.IsHideUnReadable());
  failing->hide_value = 2;
  EXPECT_FALSE(share.IsHideUnReadable());
  failing->hide_value = 1;
  failing->hide_result = -1;
  EXPECT_FALSE(share.IsHideUnReadable());
}

TEST_F(SDKShareTest, OnlyADefiniteLackOfSpaceIsNotEnough) {
  const std::string photo = sandbox_.AddShare("photo");
  EXPECT_TRUE(SDKShare("photo").IsSpaceEnough());  // the test volume has 100 MiB free
  struct Case {
    int answer;
    int error;
    bool enough;
  };
  for (const Case& c : {Case{1, 0, true}, Case{0, platform::kPlatformErrNoSpace, false},
                        Case{0, platform::kPlatformErrQuotaExceeded, false}, Case{0, platform::kPlatformErrSystem, true},
                        Case{0, 0, true}, Case{1, platform::kPlatformErrNoSpace, true}}) {
    auto space = std::make_shared<SpacePlatform>(c.answer, c.error);
    ScopedPlatform installed(space);
    EXPECT_EQ(SDKShare("photo").IsSpaceEnough(), c.enough) << c.answer << " " << c.error;
    EXPECT_EQ(space->last_path, photo);
  }
}

// A full volume as the Linux platform itself sees it through statvfs.
TEST_F(SDKShareTest, FullVolumeThroughStatvfs) {
  sandbox_.AddShare("photo");
  struct FullVolume : LinuxPlatform {
    bool VolumeFreeBytes(const std::string&, uint64_t* free_bytes) override {
      *free_bytes = 50 << 20;
      return true;
    }
  };
  ScopedPlatform installed(std::make_shared<FullVolume>());
  EXPECT_FALSE(SDKShare("photo").IsSpaceEnough());
  EXPECT_EQ(platform::LastError().code, platform::kPlatformErrNoSpace);
}

}  // namespace
}  // namespace sdk
}  // namespace corvlumex

// sdk::SDKShare over the Linux platform and over platforms that fail.
#include <gtest/gtest.h>

#include "common/error.h"
#include "sdk/share.h"
#include "tests/support/sandbox.h"
#include "tests/support/fake_platform.h"

namespace corvlumex {
namespace sdk {
namespace {

using platform::ShareInfo;
using testing_support::ExpectError;
using testing_support::JsonOf;
using testing_support::Sandbox;
using testing_support::ScopedFakePlatform;

class SDKShareTest : public ::testing::Test {
 protected:
  Sandbox sandbox_;
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
  sandbox_.AddShare("secret", JsonOf(R"({"encrypted": true, "recycle_bin": true})"));

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
  // A read-only or encrypted share is not indexable: PathRulesTest.IndexableFullPaths (archive, secret).
  EXPECT_TRUE(SDKShare("secret").IsEncryption());
  EXPECT_TRUE(SDKShare("secret").IsEnableRecycleBin());
}

TEST_F(SDKShareTest, PrivilegesComeFromThePlatformUnchanged) {
  sandbox_.AddShare("photo", JsonOf(R"({"privileges": {"nobody": "ro"}, "ftp_privilege": )" +
                                    std::to_string(platform::kFtpPrivNoUpload) + "}"));
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
  // Every share query fails, as a broken platform library would.
  ScopedFakePlatform failing;
  const auto fail = [](auto&&...) { return -1; };
  failing->ShareIsEncryptedGetHook = failing->ShareIsReadOnlyGetHook = failing->ShareIsEncryptionGetHook = fail;
  failing->ShareRecycleStatusGetHook = fail;
  failing->QueuePathComposeHook = failing->DBPathComposeHook = failing->GetIndexIDHook = fail;
  failing->ShareEnumHook = fail;
  int hide_value = 1, hide_result = 0;
  failing->ShareHideUnreadableGetHook = [&](const ShareInfo&, int* value) {
    *value = hide_value;
    return hide_result;
  };
  const SDKShare share("photo");
  ExpectError([&] { share.CanBeIndexed(); }, kErrorSystem, "KLIBShareis_encryptedGet failed, share=photo",
              "0 > KLIBShareIsEncryptedGet(share_info_, &is_encrypted)");
  failing->ShareIsEncryptedGetHook = nullptr;  // now the read-only check is the one that fails
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
  failing->StringListAllocHook = [](size_t) { return nullptr; };
  ExpectError([] { SDKShare::Enum(); }, kErrorShareEnum, "", "nullptr == (share_list = KLIBCSzListAlloc(BUFSIZ))");

  // Hide-unreadable never throws: only a successful exact 1 is true.
  EXPECT_TRUE(share.IsHideUnReadable());
  hide_value = 2;
  EXPECT_FALSE(share.IsHideUnReadable());
  hide_value = 1;
  hide_result = -1;
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
    ScopedFakePlatform space;
    std::string asked;
    space->QuotaIsEnoughHook = [&](uid_t uid, const std::string& path, uint64_t size) {
      EXPECT_EQ(uid, 0u);
      EXPECT_EQ(size, 104857600u);
      asked = path;
      platform::SetLastError(c.error, "test", 1, "");
      return c.answer;
    };
    EXPECT_EQ(SDKShare("photo").IsSpaceEnough(), c.enough) << c.answer << " " << c.error;
    EXPECT_EQ(asked, photo);
  }
}

}  // namespace
}  // namespace sdk
}  // namespace corvlumex

#include "sdk/share.h"

#include <cstdio>

#include "common/log.h"
#include "sdk/sdk_mutex.h"

namespace corvlumex {
namespace sdk {
namespace {

// 100 MiB: below this the index could not finish a commit safely.
constexpr uint64_t kMinFreeSpace = 104857600;

}  // namespace

SDKShare::SDKShare(const std::string& share_name) {
  int result;
  {
    LockMutex guard(SDKMutex());
    result = platform::Current()->ShareGet(share_name, &share_info_);
  }
  CORV_CHECK_THROW_TEXT(0 > result || !share_info_, "0 > CORVShareGet(share_name.c_str(), &share_info_) || !share_info_",
                        kErrorShareNotFound);
}

// The record is owned by share_info_ and freed with it.
SDKShare::~SDKShare() = default;

bool SDKShare::CanBeIndexed() const {
  int is_encrypted = 0;
  int is_readonly = 0;
  int result;
  {
    LockMutex guard(SDKMutex());
    result = platform::Current()->ShareIsEncryptedGet(*share_info_, &is_encrypted);
  }
  CORV_CHECK_THROW_TEXT(0 > result, "0 > KLIBShareIsEncryptedGet(share_info_, &is_encrypted)", kErrorSystem,
                        "KLIBShareis_encryptedGet failed, share=" + share_info_->name);
  {
    LockMutex guard(SDKMutex());
    result = platform::Current()->ShareIsReadOnlyGet(*share_info_, &is_readonly);
  }
  CORV_CHECK_THROW_TEXT(0 > result, "0 > KLIBShareIsReadOnlyGet(share_info_, &is_readonly)", kErrorSystem,
                        "KLIBShareis_readonlyGet failed, share=" + share_info_->name);
  return 0 == is_encrypted && 0 == is_readonly;
}

bool SDKShare::IsEncryption() const {
  int is_encryption = 0;
  int result;
  {
    LockMutex guard(SDKMutex());
    result = platform::Current()->ShareIsEncryptionGet(*share_info_, &is_encryption);
  }
  CORV_CHECK_THROW_TEXT(0 > result, "0 > KLIBShareIsEncryptionGet(share_info_, &is_encryption)", kErrorSystem,
                        "KLIBShareIsEncryptionGet failed, share=" + share_info_->name);
  return 0 != is_encryption;
}

bool SDKShare::IsEnableRecycleBin() const {
  int is_enabled = 0;
  int result;
  {
    LockMutex guard(SDKMutex());
    result = platform::Current()->ShareRecycleStatusGet(*share_info_, &is_enabled);
  }
  CORV_CHECK_THROW_TEXT(0 > result, "0 > KLIBShareRecycleStatusGet(share_info_, &is_enabled)", kErrorSystem,
                        "KLIBShareRecycleStatusGet failed, share=" + share_info_->name);
  return 0 != is_enabled;
}

bool SDKShare::IsHideUnReadable() const {
  int is_hide = 0;
  LockMutex guard(SDKMutex());
  return 0 <= platform::Current()->ShareHideUnreadableGet(*share_info_, &is_hide) && 1 == is_hide;
}

bool SDKShare::IsSpaceEnough() const {
  LockMutex guard(SDKMutex());
  if (0 != platform::Current()->QuotaIsEnough(0, share_info_->path, kMinFreeSpace)) return true;
  // Only a definite lack of space stops indexing; an unclear answer lets it go on.
  const int error = platform::LastError().code;
  return platform::kPlatformErrNoSpace != error && platform::kPlatformErrQuotaExceeded != error;
}

int SDKShare::GetPrivilege(const std::string& user) const {
  LockMutex guard(SDKMutex());
  return platform::Current()->ShareUserPrivGet(user, *share_info_);
}

uint32_t SDKShare::GetFTPPrivilege() const { return share_info_->ftp_privilege; }

std::string SDKShare::GetQueuePath() const {
  char path[platform::kPathBufferSize] = {0};
  int result;
  {
    LockMutex guard(SDKMutex());
    result = platform::Current()->QueuePathCompose(share_info_->path.c_str(), path, sizeof(path));
  }
  CORV_CHECK_THROW_TEXT(0 > result, "0 > FILEIDXQueuePathCompose(share_info_->szPath, path, sizeof(path))",
                        kErrorSystem, "FILEIDXQueuePathCompose failed, share=" + share_info_->name);
  return path;
}

std::string SDKShare::GetDBPath() const {
  char path[platform::kPathBufferSize] = {0};
  int result;
  {
    LockMutex guard(SDKMutex());
    result = platform::Current()->DBPathCompose(share_info_->path.c_str(), path, sizeof(path));
  }
  CORV_CHECK_THROW_TEXT(0 > result, "0 > FILEIDXDBPathCompose(share_info_->szPath, path, sizeof(path))",
                        kErrorSystem, "FILEIDXDBPathCompose failed, share=" + share_info_->name);
  return path;
}

std::string SDKShare::GetDBName() const {
  char name[platform::kIndexIdBufferSize] = {0};
  int result;
  {
    LockMutex guard(SDKMutex());
    result = platform::Current()->GetIndexID(share_info_->name.c_str(), name, sizeof(name));
  }
  CORV_CHECK_THROW_TEXT(0 > result, "0 > FILEIDXGetIndexID(share_info_->szName, name, sizeof(name))", kErrorSystem,
                        "FILEIDXGetIndexID failed, share=" + share_info_->name);
  return name;
}

const std::string& SDKShare::GetName() const { return share_info_->name; }

const std::string& SDKShare::GetPath() const { return share_info_->path; }

std::set<std::string> SDKShare::Enum() {
  std::set<std::string> names;
  LockMutex guard(SDKMutex());
  const std::shared_ptr<platform::Platform> current = platform::Current();
  std::unique_ptr<platform::StringList> share_list = current->StringListAlloc(BUFSIZ);
  CORV_CHECK_THROW_TEXT(nullptr == share_list, "nullptr == (share_list = KLIBCSzListAlloc(BUFSIZ))",
                        kErrorShareEnum);
  CORV_CHECK_THROW_TEXT(0 > current->ShareEnum(share_list.get(), platform::kShareEnumAll),
                        "0 > KLIBShareEnum(&share_list, &enum_func)", kErrorShareEnum, "KLIBShareEnum failed");
  for (size_t i = 0; i < share_list->size(); ++i) names.insert(share_list->at(i));
  return names;
}

}  // namespace sdk
}  // namespace corvlumex

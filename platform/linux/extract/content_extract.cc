// Content extraction of the Linux platform. For now it fills the
// file-system fields of a document; what a file holds comes later.
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>

#include "common/file_util.h"
#include "common/error.h"
#include "platform/linux/linux_platform.h"

namespace corvlumex {
namespace platform {

void LinuxPlatform::ParseFile(const std::string& path, const Json::Value&, Json::Value& document) {
  struct stat st;
  if (lstat(path.c_str(), &st) != 0) throw Error(kErrorParseDocument, "Parse failed, path=" + path);
  document = Json::Value(Json::objectValue);
  document["CORVMDPath"] = path;
  document["CORVMDParent"] = Dirname(path);
  document["CORVMDFSName"] = Basename(path);
  document["CORVMDIsDir"] = S_ISDIR(st.st_mode);
  document["CORVMDFSSize"] = static_cast<Json::Int64>(st.st_size);
  document["CORVMDFSContentChangeDate"] = static_cast<Json::Int64>(st.st_mtime);
  document["CORVMDFSAttrChangeDate"] = static_cast<Json::Int64>(st.st_ctime);
  document["CORVMDFSOwnerUid"] = static_cast<Json::UInt>(st.st_uid);
  document["CORVMDFSOwnerGid"] = static_cast<Json::UInt>(st.st_gid);
}

}  // namespace platform
}  // namespace corvlumex

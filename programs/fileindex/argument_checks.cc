#include "programs/fileindex/argument_checks.h"

#include <sys/stat.h>
#include <unistd.h>

#include <set>

#include "common/error.h"
#include "common/path_below.h"
#include "common/sys.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/paths/path_rules.h"
#include "fileindex/state/folder_mgr.h"
#include "programs/fileindex/folder_support.h"
#include "sdk/share.h"

namespace corvlumex {
namespace cli {
namespace {

std::string WithoutTrailingSlash(std::string path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

void RequireAbsolute(const std::string& path, const std::string& what) {
  if (!path.empty() && path[0] == '/') return;
  throw Error(kErrorBadArgument, "\"" + path + "\" is a relative path: give " + what);
}

const char kFolderForms[] = "the full path (/volume1/share/dir) or the share path (/share/dir)";

std::string IndexedFolders() {
  std::string list;
  const fileindex::FolderMgr configured;
  for (const auto& folder : configured.Folders()) list += (list.empty() ? "" : ", ") + folder->GetPath();
  return list.empty() ? "no folder is indexed yet (fileindex folder add FOLDER)" : "the indexed folders are: " + list;
}

}  // namespace

void RequireRoot(const std::string& command) {
  if (geteuid() == 0) return;
  throw Error(kErrorSwitchUser, "fileindex " + command +
                                    " changes the index configuration, which only root may do: run it as root "
                                    "(sudo fileindex " + command + " ...)");
}

std::string KnownShares() {
  std::string list;
  for (const std::string& name : sdk::SDKShare::Enum()) {
    list += (list.empty() ? "" : ", ") + name + " (" + sdk::SDKShare(name).GetPath() + ")";
  }
  return list.empty() ? "none (the share registry " + SysPath("/etc/corvlumex/shares.json") + " lists no share)" : list;
}

void RequireShare(const std::string& name) {
  if (sdk::SDKShare::Enum().count(name) != 0) return;
  throw Error(kErrorShareNotFound, "no share named \"" + name + "\"; the shares are: " + KnownShares());
}

std::string ExistingFolder(const std::string& folder) {
  RequireAbsolute(folder, kFolderForms);
  const std::string path = WithoutTrailingSlash(folder);
  std::string share_path = ToSharePath(path);
  std::string full_path = path;
  if (share_path == path) {
    // Not inside a share's directory: a share path, or a folder outside every share.
    std::string share_name;
    fileindex::GetShareNameByPath(share_name, path);
    if (sdk::SDKShare::Enum().count(share_name) == 0) {
      struct stat info;
      if (stat(path.c_str(), &info) == 0) {
        throw Error(kErrorPathCannotIndex,
                    path + " is outside every share; only folders inside a share can be indexed; the shares are: " +
                        KnownShares());
      }
      throw Error(kErrorBadArgument, path + " does not exist (and no share is named \"" + share_name +
                                         "\"); the shares are: " + KnownShares());
    }
    full_path = sdk::SDKShare(share_name).GetPath() + path.substr(1 + share_name.size());
  }
  struct stat info;
  if (stat(full_path.c_str(), &info) != 0) {
    throw Error(kErrorBadArgument, path + " does not exist" + (full_path != path ? " (" + full_path + ")" : ""));
  }
  if (!S_ISDIR(info.st_mode)) throw Error(kErrorBadArgument, path + " is a file, not a folder: give its folder");
  return share_path;
}

std::string ConfiguredFolder(const std::string& folder) {
  RequireAbsolute(folder, kFolderForms);
  const std::string path = ToSharePath(WithoutTrailingSlash(folder));
  if (fileindex::FolderMgr().HasFolder(path)) return path;
  throw Error(kErrorFolderNotFound, path + " is not an indexed folder; " + IndexedFolders());
}

std::vector<std::string> ConfiguredFolders(const std::vector<std::string>& folders) {
  std::vector<std::string> paths;
  for (const std::string& folder : folders) paths.push_back(ConfiguredFolder(folder));
  return paths;
}

std::vector<std::string> SharesOnVolume(const std::string& volume) {
  RequireAbsolute(volume, "the volume's directory (/volume1)");
  const std::string path = WithoutTrailingSlash(volume);
  std::vector<std::string> shares;
  for (const std::string& name : sdk::SDKShare::Enum()) {
    const std::string dir = sdk::SDKShare(name).GetPath();
    if (IsPathStrictlyBelow(dir, path)) shares.push_back(name);
  }
  if (shares.empty()) throw Error(kErrorBadArgument, "no share lies on " + path + "; the shares are: " + KnownShares());
  return shares;
}

std::string ReasonOf(int code, const std::string& reason) {
  if (code == kErrorShareEnum) {
    return reason + " (the share registry " + SysPath("/etc/corvlumex/shares.json") +
           " cannot be read; fileindex -v ... shows what is wrong in it)";
  }
  if (IsElasticBusyCode(code)) {
    return reason + " (the search daemon is busy, most often still opening an index after it started; "
                    "try again in a moment)";
  }
  if (!reason.empty() || code != kErrorShareNotFound) return reason;
  try {
    const std::set<std::string> known = sdk::SDKShare::Enum();
    std::string missing;
    for (const std::string& share : fileindex::FolderMgr().GetIndexedShares()) {
      if (known.count(share) == 0) missing += (missing.empty() ? "" : ", ") + share;
    }
    if (!missing.empty()) {
      return "indexed folders belong to shares the share registry no longer lists: " + missing +
             " (add them back to " + SysPath("/etc/corvlumex/shares.json") +
             ", or after a rename run fileindex share rename OLD NEW); the shares are: " + KnownShares();
    }
  } catch (const Error&) {
  }
  return reason;  // PrintError gives the code's meaning
}

}  // namespace cli
}  // namespace corvlumex

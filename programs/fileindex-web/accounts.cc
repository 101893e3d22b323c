#include "programs/fileindex-web/accounts.h"

#include <grp.h>
#include <pwd.h>

#include <algorithm>
#include <cerrno>

namespace corvlumex {
namespace web {
namespace {

std::optional<Account> FromEntry(const struct passwd& entry) {
  Account account;
  account.name = entry.pw_name;
  account.uid = entry.pw_uid;
  account.gid = entry.pw_gid;
  int count = 64;
  account.groups.resize(static_cast<size_t>(count));
  if (getgrouplist(entry.pw_name, entry.pw_gid, account.groups.data(), &count) < 0) {
    account.groups.resize(static_cast<size_t>(count));
    if (getgrouplist(entry.pw_name, entry.pw_gid, account.groups.data(), &count) < 0) return std::nullopt;
  }
  account.groups.resize(static_cast<size_t>(count));
  return account;
}

template <typename Lookup>
std::optional<Account> Find(Lookup lookup) {
  struct passwd entry;
  struct passwd* found = nullptr;
  std::vector<char> buffer(16384);
  const int failed = lookup(&entry, buffer.data(), buffer.size(), &found);
  errno = 0;
  if (failed != 0 || found == nullptr) return std::nullopt;
  return FromEntry(entry);
}

}  // namespace

std::optional<Account> FindAccount(const std::string& name) {
  if (name.empty()) return std::nullopt;
  return Find([&](struct passwd* e, char* b, size_t n, struct passwd** f) { return getpwnam_r(name.c_str(), e, b, n, f); });
}

std::optional<Account> FindAccount(uid_t uid) {
  return Find([&](struct passwd* e, char* b, size_t n, struct passwd** f) { return getpwuid_r(uid, e, b, n, f); });
}

bool IsAdministrator(const Account& account, const std::string& admin_group) {
  if (account.uid == 0) return true;
  struct group entry;
  struct group* found = nullptr;
  std::vector<char> buffer(65536);
  const int failed = getgrnam_r(admin_group.c_str(), &entry, buffer.data(), buffer.size(), &found);
  errno = 0;
  if (failed != 0 || found == nullptr) return false;
  return std::find(account.groups.begin(), account.groups.end(), found->gr_gid) != account.groups.end();
}

}  // namespace web
}  // namespace corvlumex

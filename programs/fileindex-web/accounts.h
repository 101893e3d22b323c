// The server's accounts as the web daemon needs them: who a name is (uid,
// primary group, every group) and whether that person administers indexing
// (root, or a member of the administrators' group).
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

namespace corvlumex {
namespace web {

struct Account {
  std::string name;
  uid_t uid = 0;
  gid_t gid = 0;
  std::vector<gid_t> groups;  // every group, the primary one included
};

std::optional<Account> FindAccount(const std::string& name);
std::optional<Account> FindAccount(uid_t uid);
// Root, or a member of `admin_group` (no such group: root only).
bool IsAdministrator(const Account& account, const std::string& admin_group);

}  // namespace web
}  // namespace corvlumex

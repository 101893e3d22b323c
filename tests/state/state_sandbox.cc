#include "tests/state/state_sandbox.h"

#include <fstream>
#include <sstream>

#include "common/json_util.h"
#include "common/sys.h"

namespace corvlumex {
namespace testing_support {

StateSandbox::StateSandbox(bool daemon) {
  root_.MakeDir("tmp");
  root_.MakeDir("var/packages/CorvLumex/etc");
  root_.MakeDir("volume1");
  SaveRegistry();
  if (daemon) daemon_ = std::make_unique<FakeDaemon>(SysPath("/var/run/fileindexd.sock"));
}

std::string StateSandbox::EtcFile(const std::string& name) const {
  return root_.path() + "/var/packages/CorvLumex/etc/" + name;
}

std::string StateSandbox::AddShare(const std::string& name, bool readonly, bool encrypted) {
  const std::string path = root_.MakeDir("volume1/" + name);
  root_.MakeDir("volume1/" + name + "/@eaDir");
  Json::Value share(Json::objectValue);
  share["name"] = name;
  share["path"] = path;
  share["readonly"] = readonly;
  share["encrypted"] = encrypted;
  shares_.append(share);
  SaveRegistry();
  return path;
}

std::string StateSandbox::Write(const std::string& relative, const std::string& content) const {
  return root_.WriteFile(relative, content);
}

std::string StateSandbox::Read(const std::string& absolute) const {
  std::ifstream input(absolute, std::ios::binary);
  std::ostringstream content;
  content << input.rdbuf();
  return content.str();
}

void StateSandbox::SaveRegistry() const {
  root_.WriteFile("etc/corvlumex/shares.json", JsonToString(shares_));
}

}  // namespace testing_support
}  // namespace corvlumex

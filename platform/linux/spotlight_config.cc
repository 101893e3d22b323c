#include "platform/linux/spotlight_config.h"

#include <algorithm>

#include "common/index_fields.h"
#include "platform/platform.h"

#ifndef CORVLUMEX_SPOTLIGHT_MAPPINGS
#define CORVLUMEX_SPOTLIGHT_MAPPINGS "/usr/share/corvlumex/spotlight_mappings.json"
#endif

namespace corvlumex {
namespace platform {
namespace {

std::string Trim(const std::string& text) {
  const size_t begin = text.find_first_not_of(" \t\r");
  if (begin == std::string::npos) return std::string();
  return text.substr(begin, text.find_last_not_of(" \t\r") - begin + 1);
}

std::string Lower(std::string text) {
  for (char& c : text) c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
  return text;
}

}  // namespace

SpotlightConfig ReadSpotlightConfig(const std::string& text) {
  SpotlightConfig config;
  std::string section;
  size_t begin = 0;
  while (begin < text.size()) {
    size_t end = text.find('\n', begin);
    if (end == std::string::npos) end = text.size();
    const std::string line = Trim(text.substr(begin, end - begin));
    begin = end + 1;
    if (line.size() > 2 && line.front() == '[' && line.back() == ']') {
      section = line.substr(1, line.size() - 2);
      if (Lower(section) != "global") config.shares.push_back(section);
      continue;
    }
    const size_t equals = line.find('=');
    if (equals == std::string::npos || Lower(section) != "global") continue;
    std::string key = Lower(Trim(line.substr(0, equals)));
    key.erase(std::remove(key.begin(), key.end(), ' '), key.end());
    if (key == "spotlightbackend") config.enabled = Lower(Trim(line.substr(equals + 1))) == "elasticsearch";
  }
  std::sort(config.shares.begin(), config.shares.end());
  return config;
}

std::string WriteSpotlightConfig(const SpotlightConfig& config,
                                 const std::function<std::string(const std::string& share)>& index_of) {
  std::string text =
      "# Written by CorvLumex: Spotlight search for SMB clients (Finder), answered\n"
      "# from the search index by corvspotlightd. Include this file once, at the\n"
      "# end of smb.conf:  include = /etc/samba/corvlumex-spotlight.conf\n"
      "[global]\n";
  text += std::string("\tspotlight backend = ") + (config.enabled ? "elasticsearch" : "noindex") + "\n";
  text += "\telasticsearch:address = 127.0.0.1\n";
  text += "\telasticsearch:port = " + std::to_string(kSpotlightResponderPort) + "\n";
  text += "\telasticsearch:use tls = no\n";
  text += "\telasticsearch:mappings = " CORVLUMEX_SPOTLIGHT_MAPPINGS "\n";
  text += std::string("\telasticsearch:default_fields = \"") + kFieldFSName + "\", \"" + kFieldTextContent + "\"\n";
  // Finder asks for attributes and kinds we do not index: those parts of a
  // search are dropped instead of failing the whole search.
  text += "\telasticsearch:ignore unknown attribute = yes\n";
  text += "\telasticsearch:ignore unknown type = yes\n";
  for (const std::string& share : config.shares) {
    text += "\n[" + share + "]\n";
    text += std::string("\tspotlight = ") + (config.enabled ? "yes" : "no") + "\n";
    // A share takes the defaults of [global] as they stood where the share
    // was defined, and smb.conf defines its shares before this file.
    text += std::string("\tspotlight backend = ") + (config.enabled ? "elasticsearch" : "noindex") + "\n";
    text += "\telasticsearch:index = " + SpotlightIndexName(index_of(share)) + "\n";
  }
  return text;
}

std::string SpotlightIndexName(const std::string& index_id) {
  if (index_id.empty()) return "_all";
  for (const char c : index_id) {
    if (!isalnum(static_cast<unsigned char>(c)) && c != '_' && c != '-' && c != '.') return "_all";
  }
  return index_id;
}

bool CanBeSectionName(const std::string& share) {
  return !share.empty() && share.find_first_of("[]\n\r") == std::string::npos && Trim(share) == share &&
         Lower(share) != "global";
}

}  // namespace platform
}  // namespace corvlumex

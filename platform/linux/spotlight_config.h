// The Samba include file of the SMB Spotlight switch:
// SysPath("/etc/samba/corvlumex-spotlight.conf"), included once at the end of
// smb.conf. It holds the whole Spotlight configuration Samba needs, so that
// the switch alone turns Finder searches on or off:
//
//   [global]
//   	spotlight backend = elasticsearch        (noindex when off)
//   	elasticsearch:address = 127.0.0.1         (an IP: Samba resolves names by DNS only)
//   	elasticsearch:port = 9210
//   	elasticsearch:mappings = <our mappings file>
//   	...
//   [photo]                                     (one section per indexed share; Samba
//   	spotlight = yes                           merges it into the share's own section)
//   	spotlight backend = elasticsearch
//   	elasticsearch:index = fileindex_photo
//
// The file is also where the switch's state is read back from: the back end
// line says on or off, the share sections which shares are indexed.
#pragma once

#include <functional>
#include <string>
#include <vector>

namespace corvlumex {
namespace platform {

struct SpotlightConfig {
  bool enabled = false;
  std::vector<std::string> shares;  // sorted
};

// What the file says; a missing or foreign file is "off, no shares".
SpotlightConfig ReadSpotlightConfig(const std::string& text);

// The file's text. `index_of` gives a share's index name.
std::string WriteSpotlightConfig(const SpotlightConfig& config,
                                 const std::function<std::string(const std::string& share)>& index_of);

// The index name Samba puts in its URL for a share's index: the name itself
// when it is safe in a URL path, else "_all" (the responder then finds the
// share from the folder searched).
std::string SpotlightIndexName(const std::string& index_id);

// False for names no smb.conf section can carry ("]", line breaks).
bool CanBeSectionName(const std::string& share);

}  // namespace platform
}  // namespace corvlumex

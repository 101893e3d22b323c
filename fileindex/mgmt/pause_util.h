// Setting and clearing a share's pause bits, with fileindexd told when the
// share's worker has to stop or may start again.
#pragma once

#include <string>

namespace corvlumex {
namespace fileindex {

class FolderMgr;

// Sets `bit`. When the share is indexed and was not paused by another bit,
// "worker_delete" goes to fileindexd; if that fails the bit is cleared again
// and the Error propagates.
void PauseShareBits(const FolderMgr& folder_mgr, const std::string& share_name, unsigned int bit);
// Clears `bits`. When the share is indexed and no pause bit is left,
// "worker_create" goes to fileindexd; if that fails the bits are set again.
void ResumeShareBits(const FolderMgr& folder_mgr, const std::string& share_name, unsigned int bits);

}  // namespace fileindex
}  // namespace corvlumex

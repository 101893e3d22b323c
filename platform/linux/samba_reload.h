// Telling a running Samba to read its configuration again, without a restart
// (a restart drops every connected SMB client).
//
// smbd's own reload (`smbcontrol smbd reload-config`, or systemd's reload,
// which signals the main smbd) does not reach the RPC workers samba-dcerpcd
// starts on demand: `rpcd_mdssvc`, which serves Finder's searches, keeps the
// configuration it started with, so a share's Spotlight switched off would go
// on answering until the worker happened to end. The workers re-read the
// configuration on SIGHUP (and only then: Samba's messages, even
// `smbcontrol all reload-config`, leave them as they are), so a reload is
// smbd's reload followed by a SIGHUP to each worker. Each worker then decides
// with the new configuration on the next mdssvc pipe a client opens; no SMB
// session and no open pipe is cut.
#pragma once

#include <string>
#include <sys/types.h>
#include <vector>

#include "platform/platform.h"

namespace corvlumex {
namespace platform {

// The running Samba RPC workers: processes whose program is an "rpcd_*"
// installed beside samba-dcerpcd (so a user's own process that merely takes
// that name is never signalled). With `config_file` non-empty, only the
// workers started with that configuration file (a private Samba, as in a
// test); empty, those of the machine's own Samba (started with no configuration
// file or with /etc/samba/smb.conf). Sorted.
std::vector<pid_t> SambaRpcWorkers(const std::string& config_file);

// smbd's reload through smbcontrol (with --configfile when `config_file` is
// non-empty), then SIGHUP to every worker above. 0 on success; -1 with the
// failure recorded when smbcontrol fails. A worker that has ended meanwhile
// is no failure: the next one starts with the new configuration anyway.
int ReloadSamba(Platform* platform, const std::string& config_file);

// The workers' half of the reload alone, for a reload that already reached
// smbd some other way (systemd's reload). Only a worker that already has its
// SIGHUP handler is signalled: one still starting would be ended by it, and
// reads the new configuration anyway. Returns how many were signalled.
size_t ReloadSambaRpcWorkers(const std::string& config_file);

}  // namespace platform
}  // namespace corvlumex

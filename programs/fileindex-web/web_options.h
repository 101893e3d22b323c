// How the web daemon runs: where it listens, its certificate, where the
// pages are, who administers, how long sessions live.
#pragma once

#include <string>

namespace corvlumex {
namespace web {

struct WebOptions {
  std::string address = "127.0.0.1";  // loopback unless told otherwise
  int port = 8480;
  std::string certificate, key;       // both given: HTTPS
  std::string web_root;               // the pages (index.html, admin.html, ...)
  std::string admin_group = "sudo";
  std::string pam_service = "fileindex-web";
  int idle_minutes = 30;
  int lifetime_hours = 12;
  int threads = 24;
  // In a sandbox only: write a one-time sign-in link for the daemon's own
  // user to this file at start.
  std::string sign_in_link_file;

  bool https() const { return !certificate.empty() && !key.empty(); }
};

}  // namespace web
}  // namespace corvlumex

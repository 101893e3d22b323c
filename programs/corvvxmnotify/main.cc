// corvvxmnotify: raises a notice for the administrators.
//
//   corvvxmnotify -c APP [-b true|false] [-e true|false] TARGET TITLE MESSAGE [LINK_OPEN LINK_CLOSE]
//
// On a Linux host the notice goes to syslog and to the notices log that
// `fileindex status` shows. Exit 0 when delivered, 1 when the log could not
// be written, 2 on a bad command line.
#include <CLI/CLI.hpp>
#include <cstdio>
#include <string>
#include <vector>

#include "programs/corvvxmnotify/notice.h"

namespace {

bool ParseBool(const std::string& text, bool* value) {
  if (text == "true") *value = true;
  else if (text == "false") *value = false;
  else return false;
  return true;
}

}  // namespace

int main(int argc, char** argv) {
  corvlumex::notify::Notice notice;
  std::string badge = "false";
  std::string email = "false";
  std::vector<std::string> positional;
  CLI::App app{"Raises a notice for the administrators of the file-search system."};
  app.add_option("-c", notice.application, "application that owns the notice")->required();
  app.add_option("-b", badge, "show a badge: true or false");
  app.add_option("-e", email, "also send by mail: true or false");
  app.add_option("args", positional, "TARGET TITLE MESSAGE [LINK_OPEN LINK_CLOSE]")->expected(3, 5);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    const int printed = app.exit(error);  // prints help or the fault
    return printed == 0 ? 0 : 2;
  }

  if (!ParseBool(badge, &notice.badge) || !ParseBool(email, &notice.email)) {
    fprintf(stderr, "corvvxmnotify: -b and -e take true or false\n");
    return 2;
  }
  if (positional.size() == 4) {
    fprintf(stderr, "corvvxmnotify: a link needs both its opening and its closing part\n");
    return 2;
  }
  notice.target = positional[0];
  notice.title_key = positional[1];
  notice.message_key = positional[2];
  if (positional.size() == 5) {
    notice.link_open = positional[3];
    notice.link_close = positional[4];
  }
  if (!corvlumex::notify::Deliver(notice)) {
    fprintf(stderr, "corvvxmnotify: cannot write the notices log\n");
    return 1;
  }
  return 0;
}

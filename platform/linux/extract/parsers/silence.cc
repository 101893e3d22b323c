// The parser libraries report every oddity of a damaged file on stderr; in a
// worker that sees thousands of files that is noise. Failures still reach
// the caller as the worker's answer.
#include <exiv2/exiv2.hpp>
#include <libxml/parser.h>
#include <poppler/cpp/poppler-global.h>
#include <taglib/tdebuglistener.h>
extern "C" {
#include <libavutil/log.h>
}

#include "platform/linux/extract/parsers/formats.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

class QuietTagLib : public TagLib::DebugListener {
 public:
  void printMessage(const TagLib::String&) override {}
};

void QuietPoppler(const std::string&, void*) {}

void QuietXml(void*, const char*, ...) {}

}  // namespace

void SilenceParserLibraries() {
  static QuietTagLib quiet_taglib;
  TagLib::setDebugListener(&quiet_taglib);
  poppler::set_debug_error_function(QuietPoppler, nullptr);
  Exiv2::LogMsg::setLevel(Exiv2::LogMsg::mute);
  av_log_set_level(AV_LOG_QUIET);
  xmlSetGenericErrorFunc(nullptr, QuietXml);
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex

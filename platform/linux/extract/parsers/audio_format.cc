// Audio tags and properties with TagLib (MP3, FLAC, Ogg Vorbis/Opus/Speex,
// MP4/M4A, WAV, AIFF, WMA, APE, WavPack, Musepack and the tracker formats
// TagLib knows). TagLib picks the format from the name's extension and, for
// an unknown one, from the content.
#include <taglib/audioproperties.h>
#include <taglib/fileref.h>
#include <taglib/tag.h>
#include <taglib/tfilestream.h>
#include <taglib/tpropertymap.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <memory>

#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/parsers/file_bytes.h"
#include "platform/linux/extract/parsers/formats.h"
#include "platform/linux/extract/parsers/text_sink.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

// A read-only stream over our descriptor that reports the original name,
// from which TagLib takes the format.
class NamedStream : public TagLib::FileStream {
 public:
  NamedStream(int fd, const std::string& name) : TagLib::FileStream(fd, true), name_(name) {}
  TagLib::FileName name() const override { return name_.c_str(); }

 private:
  std::string name_;
};

void SetText(Json::Value& fields, const char* field, const TagLib::String& value) {
  const std::string text = CleanUtf8(value.to8Bit(true));
  if (!text.empty()) fields[field] = text;
}

void SetPositive(Json::Value& fields, const char* field, long long value) {
  if (value > 0) fields[field] = static_cast<Json::Int64>(value);
}

}  // namespace

void ExtractAudio(int fd, const std::string& name, Json::Value& fields) {
  // TagLib closes the stream's descriptor when done: give it its own.
  const int own = dup(fd);
  if (own < 0) throw ExtractError(std::string("cannot duplicate the descriptor: ") + strerror(errno));
  NamedStream stream(own, name);
  if (!stream.isOpen()) throw ExtractError("cannot read the audio file");
  TagLib::FileRef file(&stream, true, TagLib::AudioProperties::Average);
  if (file.isNull() || !file.file()->isValid()) throw ExtractError("not an audio file TagLib can read");

  if (const TagLib::Tag* tag = file.tag()) {
    SetText(fields, kFieldTitle, tag->title());
    SetText(fields, kFieldAuthors, tag->artist());
    SetText(fields, kFieldAlbum, tag->album());
    SetText(fields, kFieldGenre, tag->genre());
    SetText(fields, kFieldComment, tag->comment());
    SetPositive(fields, kFieldTrackNumber, tag->track());
    SetPositive(fields, kFieldRecordingYear, tag->year());
    // The file's map, not the tag's: only the file merges all its tags.
    const TagLib::PropertyMap properties = file.file()->properties();
    const auto composer = properties.find("COMPOSER");
    if (composer != properties.end() && !composer->second.isEmpty()) {
      SetText(fields, kFieldComposer, composer->second.toString(" "));
    }
    const auto comment = properties.find("COMMENT");
    if (!fields.isMember(kFieldComment) && comment != properties.end() && !comment->second.isEmpty()) {
      SetText(fields, kFieldComment, comment->second.toString(" "));
    }
  }
  if (const TagLib::AudioProperties* audio = file.audioProperties()) {
    const int milliseconds = audio->lengthInMilliseconds();
    if (milliseconds > 0) fields[kFieldDuration] = milliseconds / 1000.0;
    SetPositive(fields, kFieldAudioBitRate, audio->bitrate());
    SetPositive(fields, kFieldTotalBitRate, audio->bitrate());
    SetPositive(fields, kFieldSampleRate, audio->sampleRate());
    SetPositive(fields, kFieldChannelCount, audio->channels());
  }
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex

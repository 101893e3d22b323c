// Video containers with libavformat (MP4/MOV, Matroska/WebM, AVI, MPEG
// program and transport streams, FLV, ASF/WMV, Ogg, 3GP): duration, bit
// rates, codecs and the container's tags. The container is read through our
// descriptor (a custom I/O context); no frame is decoded beyond what the
// stream probe needs.
extern "C" {
#include <libavcodec/avcodec.h>
#include <libavformat/avformat.h>
#include <libavutil/dict.h>
}
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <set>
#include <string>

#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/parsers/dates.h"
#include "platform/linux/extract/parsers/file_bytes.h"
#include "platform/linux/extract/parsers/formats.h"
#include "platform/linux/extract/parsers/text_sink.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

constexpr int kIoBufferSize = 64 * 1024;

struct Source {
  int fd;
  int64_t position;
  int64_t size;
};

int ReadPacket(void* opaque, uint8_t* buffer, int size) {
  Source* source = static_cast<Source*>(opaque);
  ssize_t got;
  do {
    got = pread(source->fd, buffer, static_cast<size_t>(size), source->position);
  } while (got < 0 && errno == EINTR);
  if (got < 0) return AVERROR(errno);
  if (got == 0) return AVERROR_EOF;
  source->position += got;
  return static_cast<int>(got);
}

int64_t Seek(void* opaque, int64_t offset, int whence) {
  Source* source = static_cast<Source*>(opaque);
  switch (whence & ~AVSEEK_FORCE) {
    case AVSEEK_SIZE:
      return source->size;
    case SEEK_SET:
      break;
    case SEEK_CUR:
      offset += source->position;
      break;
    case SEEK_END:
      offset += source->size;
      break;
    default:
      return AVERROR(EINVAL);
  }
  if (offset < 0) return AVERROR(EINVAL);
  source->position = offset;
  return offset;
}

// Frees the demuxer and our I/O context (whose buffer libavformat may have replaced).
class Demuxer {
 public:
  explicit Demuxer(Source* source) {
    uint8_t* buffer = static_cast<uint8_t*>(av_malloc(kIoBufferSize));
    if (buffer == nullptr) throw ExtractError("out of memory");
    io_ = avio_alloc_context(buffer, kIoBufferSize, 0, source, ReadPacket, nullptr, Seek);
    if (io_ == nullptr) {
      av_free(buffer);
      throw ExtractError("out of memory");
    }
    context_ = avformat_alloc_context();
    if (context_ == nullptr) throw ExtractError("out of memory");
    context_->pb = io_;
    context_->flags |= AVFMT_FLAG_CUSTOM_IO;
  }
  ~Demuxer() {
    avformat_close_input(&context_);
    if (io_ != nullptr) {
      av_freep(&io_->buffer);
      avio_context_free(&io_);
    }
  }
  Demuxer(const Demuxer&) = delete;
  Demuxer& operator=(const Demuxer&) = delete;

  void Open() {
    AVDictionary* options = nullptr;
    // Decoders that the probe opens stay on this thread.
    av_dict_set(&options, "threads", "1", 0);
    const int opened = avformat_open_input(&context_, nullptr, nullptr, &options);
    av_dict_free(&options);
    if (opened < 0) {
      context_ = nullptr;  // freed by libavformat on failure
      throw ExtractError("not a video container libavformat can read");
    }
    if (avformat_find_stream_info(context_, nullptr) < 0) throw ExtractError("the video's streams cannot be read");
  }

  AVFormatContext* context() const { return context_; }

 private:
  AVIOContext* io_ = nullptr;
  AVFormatContext* context_ = nullptr;
};

std::string Tag(const AVDictionary* tags, const char* key) {
  const AVDictionaryEntry* entry = av_dict_get(tags, key, nullptr, 0);
  return entry != nullptr && entry->value != nullptr ? CleanUtf8(entry->value) : std::string();
}

void SetText(Json::Value& fields, const char* field, const std::string& value) {
  if (!value.empty()) fields[field] = value;
}

int64_t Kilobits(int64_t bits_per_second) { return (bits_per_second + 500) / 1000; }

}  // namespace

void ExtractVideo(int fd, Json::Value& fields) {
  struct stat st;
  if (fstat(fd, &st) != 0) throw ExtractError("cannot read the file's status");
  Source source = {fd, 0, static_cast<int64_t>(st.st_size)};
  Demuxer demuxer(&source);
  demuxer.Open();
  const AVFormatContext* context = demuxer.context();

  if (context->duration > 0) fields[kFieldDuration] = static_cast<double>(context->duration) / AV_TIME_BASE;
  if (context->bit_rate > 0) fields[kFieldTotalBitRate] = static_cast<Json::Int64>(Kilobits(context->bit_rate));
  std::set<std::string> seen;
  std::string codecs;
  for (unsigned int i = 0; i < context->nb_streams; ++i) {
    const AVCodecParameters* codec = context->streams[i]->codecpar;
    if (codec->codec_type != AVMEDIA_TYPE_VIDEO && codec->codec_type != AVMEDIA_TYPE_AUDIO) continue;
    // Cover pictures are video streams of one frame, not the film's codec.
    if (context->streams[i]->disposition & AV_DISPOSITION_ATTACHED_PIC) continue;
    const std::string name = avcodec_get_name(codec->codec_id);
    if (seen.insert(name).second) codecs += (codecs.empty() ? "" : " ") + name;
    const int64_t rate = codec->bit_rate > 0 ? Kilobits(codec->bit_rate) : 0;
    if (codec->codec_type == AVMEDIA_TYPE_VIDEO && !fields.isMember(kFieldPixelWidth)) {
      SetPixelSize(fields, codec->width, codec->height);
    }
    if (codec->codec_type == AVMEDIA_TYPE_VIDEO && rate > 0 && !fields.isMember(kFieldVideoBitRate)) {
      fields[kFieldVideoBitRate] = static_cast<Json::Int64>(rate);
    }
    if (codec->codec_type == AVMEDIA_TYPE_AUDIO && !fields.isMember(kFieldSampleRate)) {
      if (rate > 0) fields[kFieldAudioBitRate] = static_cast<Json::Int64>(rate);
      if (codec->sample_rate > 0) fields[kFieldSampleRate] = codec->sample_rate;
      if (codec->ch_layout.nb_channels > 0) fields[kFieldChannelCount] = codec->ch_layout.nb_channels;
    }
  }
  SetText(fields, kFieldCodecs, codecs);

  const AVDictionary* tags = context->metadata;
  SetText(fields, kFieldTitle, Tag(tags, "title"));
  SetText(fields, kFieldAuthors, Tag(tags, "artist"));
  SetText(fields, kFieldAlbum, Tag(tags, "album"));
  SetText(fields, kFieldComposer, Tag(tags, "composer"));
  SetText(fields, kFieldGenre, Tag(tags, "genre"));
  SetText(fields, kFieldComment, Tag(tags, "comment"));
  SetText(fields, kFieldDescription, Tag(tags, "description"));
  int64_t seconds;
  if (ParseIsoDate(Tag(tags, "creation_time"), &seconds)) {
    fields[kFieldContentCreationDate] = static_cast<Json::Int64>(seconds);
  }
  const std::string date = Tag(tags, "date");
  if (date.size() >= 4 && date.compare(0, 4, "0000") != 0) {
    const int year = atoi(date.substr(0, 4).c_str());
    if (year > 0) fields[kFieldRecordingYear] = year;
  }
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex

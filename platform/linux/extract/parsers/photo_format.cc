// Photo metadata with Exiv2: EXIF (camera, exposure, resolution, date taken)
// and IPTC (title, keywords) of JPEG, TIFF, PNG, WebP and the camera raw
// formats Exiv2 knows. The picture itself is never decoded.
#include <exiv2/exiv2.hpp>

#include <cmath>
#include <cstdio>

#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/parsers/dates.h"
#include "platform/linux/extract/parsers/file_bytes.h"
#include "platform/linux/extract/parsers/formats.h"
#include "platform/linux/extract/parsers/text_sink.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

const Exiv2::Exifdatum* FindExif(const Exiv2::ExifData& exif, const char* key) {
  const auto found = exif.findKey(Exiv2::ExifKey(key));
  if (found == exif.end() || found->count() == 0) return nullptr;
  return &*found;
}

void SetText(Json::Value& fields, const char* field, std::string value) {
  // EXIF strings are fixed-size fields padded with NULs and blanks.
  while (!value.empty() && (value.back() == '\0' || value.back() == ' ')) value.pop_back();
  const std::string text = CleanUtf8(value);
  if (!text.empty()) fields[field] = text;
}

void SetExifText(Json::Value& fields, const char* field, const Exiv2::ExifData& exif, const char* key) {
  if (const Exiv2::Exifdatum* datum = FindExif(exif, key)) SetText(fields, field, datum->toString());
}

// "1/125" for short exposures, "2.5" (seconds) for long ones.
std::string ExposureText(const Exiv2::Rational& value) {
  if (value.first <= 0 || value.second <= 0) return std::string();
  char text[32];
  if (value.first >= value.second) {
    snprintf(text, sizeof(text), "%g", static_cast<double>(value.first) / value.second);
  } else {
    snprintf(text, sizeof(text), "1/%.0f", static_cast<double>(value.second) / value.first);
  }
  return text;
}

// "f/2.8", "f/8".
std::string ApertureText(const Exiv2::Rational& value) {
  if (value.first <= 0 || value.second <= 0) return std::string();
  char text[32];
  snprintf(text, sizeof(text), "f/%g", std::round(10.0 * value.first / value.second) / 10.0);
  return text;
}

// Dots per inch from an EXIF resolution and its unit (2 = inch, 3 = cm).
void SetResolution(Json::Value& fields, const char* field, const Exiv2::ExifData& exif, const char* key, long unit) {
  const Exiv2::Exifdatum* datum = FindExif(exif, key);
  if (datum == nullptr) return;
  const Exiv2::Rational value = datum->toRational(0);
  if (value.first <= 0 || value.second <= 0) return;
  double dpi = static_cast<double>(value.first) / value.second;
  if (unit == 3) dpi *= 2.54;
  if (dpi >= 1 && dpi < 1e6) fields[field] = static_cast<Json::Int64>(std::lround(dpi));
}

}  // namespace

void ExtractPhoto(int fd, Json::Value& fields) {
  const MappedFile file(fd);
  if (file.size() > static_cast<size_t>(LONG_MAX)) throw ExtractError("the picture is too large");
  Exiv2::Image::AutoPtr image =
      Exiv2::ImageFactory::open(reinterpret_cast<const Exiv2::byte*>(file.data()), static_cast<long>(file.size()));
  if (image.get() == nullptr) throw ExtractError("not a picture format Exiv2 can read");
  image->readMetadata();

  // The size Exiv2 reads from the format's own header, not from EXIF (which
  // an editor that crops the picture often leaves unchanged).
  SetPixelSize(fields, image->pixelWidth(), image->pixelHeight());
  const Exiv2::ExifData& exif = image->exifData();
  SetExifText(fields, kFieldMake, exif, "Exif.Image.Make");
  SetExifText(fields, kFieldModel, exif, "Exif.Image.Model");
  SetExifText(fields, kFieldAuthors, exif, "Exif.Image.Artist");
  SetExifText(fields, kFieldDescription, exif, "Exif.Image.ImageDescription");
  SetExifText(fields, kFieldCreator, exif, "Exif.Image.Software");
  if (const Exiv2::Exifdatum* iso = FindExif(exif, "Exif.Photo.ISOSpeedRatings")) {
    const long value = iso->toLong(0);
    if (value > 0) fields[kFieldISOSpeed] = static_cast<Json::Int64>(value);
  }
  if (const Exiv2::Exifdatum* exposure = FindExif(exif, "Exif.Photo.ExposureTime")) {
    SetText(fields, kFieldExposureTime, ExposureText(exposure->toRational(0)));
  }
  if (const Exiv2::Exifdatum* aperture = FindExif(exif, "Exif.Photo.FNumber")) {
    SetText(fields, kFieldAperture, ApertureText(aperture->toRational(0)));
  }
  long unit = 2;
  if (const Exiv2::Exifdatum* datum = FindExif(exif, "Exif.Image.ResolutionUnit")) unit = datum->toLong(0);
  SetResolution(fields, kFieldResolutionWidthDPI, exif, "Exif.Image.XResolution", unit);
  SetResolution(fields, kFieldResolutionHeightDPI, exif, "Exif.Image.YResolution", unit);
  int64_t seconds;
  if (const Exiv2::Exifdatum* taken = FindExif(exif, "Exif.Photo.DateTimeOriginal")) {
    if (ParseExifDate(taken->toString(), &seconds)) fields[kFieldContentCreationDate] = static_cast<Json::Int64>(seconds);
  }
  if (const Exiv2::Exifdatum* changed = FindExif(exif, "Exif.Image.DateTime")) {
    if (ParseExifDate(changed->toString(), &seconds)) {
      fields[kFieldContentModificationDate] = static_cast<Json::Int64>(seconds);
    }
  }

  const Exiv2::IptcData& iptc = image->iptcData();
  std::string keywords;
  for (const Exiv2::Iptcdatum& datum : iptc) {
    if (datum.key() == "Iptc.Application2.ObjectName" && !fields.isMember(kFieldTitle)) {
      SetText(fields, kFieldTitle, datum.toString());
    } else if (datum.key() == "Iptc.Application2.Keywords") {
      keywords += (keywords.empty() ? "" : ", ") + datum.toString();
    }
  }
  SetText(fields, kFieldKeywords, keywords);
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex

// Photos with Exiv2: the EXIF camera settings, the date taken, the pixel
// size and orientation, and GPS position when the camera recorded one. Exiv2
// reads the metadata segments only, never the image data.
#include <cmath>
#include <cstdio>
#include <exiv2/exiv2.hpp>
#include <mutex>
#include <string>

#include "extract_util.h"
#include "extractors.h"

namespace orvex {
namespace extract {
namespace {

const Exiv2::Exifdatum* Find(const Exiv2::ExifData& exif, const char* key) {
  const auto it = exif.findKey(Exiv2::ExifKey(key));
  if (it == exif.end() || it->count() == 0) return nullptr;
  return &*it;
}

std::string Text(const Exiv2::ExifData& exif, const char* key) {
  const Exiv2::Exifdatum* datum = Find(exif, key);
  return datum == nullptr ? std::string() : datum->toString();
}

// A rational as a float; false when missing or with a zero denominator.
bool Number(const Exiv2::ExifData& exif, const char* key, long n, double* value) {
  const Exiv2::Exifdatum* datum = Find(exif, key);
  if (datum == nullptr || datum->count() <= n) return false;
  const Exiv2::Rational r = datum->toRational(n);
  if (r.second == 0) return false;
  *value = static_cast<double>(r.first) / r.second;
  return std::isfinite(*value);
}

std::string Format(const char* format, double value) {
  char text[64];
  std::snprintf(text, sizeof(text), format, value);
  return text;
}

// Exposure as photographers write it: "1/250" below a second, "2.5" above.
std::string ExposureText(const Exiv2::ExifData& exif) {
  double seconds = 0;
  if (!Number(exif, "Exif.Photo.ExposureTime", 0, &seconds) || seconds <= 0) return "";
  if (seconds >= 1) return Format("%g", seconds);
  return "1/" + Format("%.0f", 1 / seconds);
}

// EXIF dates are "YYYY:MM:DD HH:MM:SS" in the camera's local time, which
// the file seldom states; without an offset they are read as UTC.
void SetDateTaken(const Exiv2::ExifData& exif, Json::Value& out) {
  std::string date = Text(exif, "Exif.Photo.DateTimeOriginal");
  std::string offset = Text(exif, "Exif.Photo.OffsetTimeOriginal");
  if (date.empty()) {
    date = Text(exif, "Exif.Image.DateTime");
    offset = Text(exif, "Exif.Photo.OffsetTime");
  }
  if (date.size() < 19 || date[4] != ':' || date[7] != ':') return;
  date[4] = '-';
  date[7] = '-';
  int64_t seconds = 0;
  if (ParseIsoDate(date.substr(0, 19) + CleanValue(offset), &seconds) ||
      ParseIsoDate(date.substr(0, 19), &seconds)) {
    SetInt(out, "KALOMDContentCreationDate", seconds);
  }
}

void SetResolution(const Exiv2::ExifData& exif, Json::Value& out) {
  // Resolution unit 3 is centimetres; 2 (inches) is the default.
  const double per_inch = Text(exif, "Exif.Image.ResolutionUnit") == "3" ? 2.54 : 1.0;
  double x = 0, y = 0;
  if (Number(exif, "Exif.Image.XResolution", 0, &x) && x > 0 && x < 1e6) {
    SetInt(out, "KALOMDResolutionWidthDPI", std::lround(x * per_inch));
  }
  if (Number(exif, "Exif.Image.YResolution", 0, &y) && y > 0 && y < 1e6) {
    SetInt(out, "KALOMDResolutionHeightDPI", std::lround(y * per_inch));
  }
}

// Degrees, minutes and seconds with their hemisphere, as signed degrees.
bool Coordinate(const Exiv2::ExifData& exif, const char* key, const char* ref_key,
                const char* negative, double* degrees) {
  double d = 0, m = 0, s = 0;
  if (!Number(exif, key, 0, &d) || !Number(exif, key, 1, &m) || !Number(exif, key, 2, &s)) {
    return false;
  }
  *degrees = d + m / 60 + s / 3600;
  if (Text(exif, ref_key) == negative) *degrees = -*degrees;
  return true;
}

// Properties the index's table does not list keep its default string type.
void SetGps(const Exiv2::ExifData& exif, Json::Value& out) {
  double latitude = 0, longitude = 0, altitude = 0;
  if (Coordinate(exif, "Exif.GPSInfo.GPSLatitude", "Exif.GPSInfo.GPSLatitudeRef", "S", &latitude) &&
      Coordinate(exif, "Exif.GPSInfo.GPSLongitude", "Exif.GPSInfo.GPSLongitudeRef", "W",
                 &longitude) &&
      std::fabs(latitude) <= 90 && std::fabs(longitude) <= 180) {
    out["KALOMDLatitude"] = Format("%.6f", latitude);
    out["KALOMDLongitude"] = Format("%.6f", longitude);
    if (Number(exif, "Exif.GPSInfo.GPSAltitude", 0, &altitude)) {
      if (Text(exif, "Exif.GPSInfo.GPSAltitudeRef") == "1") altitude = -altitude;
      out["KALOMDAltitude"] = Format("%.1f", altitude);
    }
  }
}

void ReadExif(const Exiv2::ExifData& exif, Json::Value& out) {
  SetText(out, "KALOMDAcquisitionMake", Text(exif, "Exif.Image.Make"));
  SetText(out, "KALOMDAcquisitionModel", Text(exif, "Exif.Image.Model"));
  SetText(out, "KALOMDExposureTimeString", ExposureText(exif));
  double f_number = 0;
  if (Number(exif, "Exif.Photo.FNumber", 0, &f_number) && f_number > 0) {
    out["KALOMDAperture"] = Format("%.1f", f_number);
  }
  const Exiv2::Exifdatum* iso = Find(exif, "Exif.Photo.ISOSpeedRatings");
  if (iso != nullptr) SetPositiveInt(out, "KALOMDISOSpeed", iso->toLong(0));
  SetResolution(exif, out);
  SetDateTaken(exif, out);
  SetText(out, "KALOMDDescription", Text(exif, "Exif.Image.ImageDescription"));
  SetText(out, "KALOMDAuthors", Text(exif, "Exif.Image.Artist"));
  SetText(out, "KALOMDCreator", Text(exif, "Exif.Image.Software"));
  SetText(out, "KALOMDLensModel", Text(exif, "Exif.Photo.LensModel"));
  double focal = 0;
  if (Number(exif, "Exif.Photo.FocalLength", 0, &focal) && focal > 0) {
    out["KALOMDFocalLength"] = Format("%g", focal);
  }
  const Exiv2::Exifdatum* orientation = Find(exif, "Exif.Image.Orientation");
  if (orientation != nullptr) {
    const long value = orientation->toLong(0);
    if (value >= 1 && value <= 8) out["KALOMDOrientation"] = std::to_string(value);
  }
  SetGps(exif, out);
}

}  // namespace

bool ExtractImage(const ExtractRequest& request) {
  static std::once_flag init;
  std::call_once(init, [] {
    Exiv2::LogMsg::setLevel(Exiv2::LogMsg::mute);
    Exiv2::XmpParser::initialize();
  });
  try {
    const Exiv2::Image::AutoPtr image = Exiv2::ImageFactory::open(request.path);
    if (image.get() == nullptr) return Fail(request.problem, "exiv2: cannot open");
    image->readMetadata();
    ReadExif(image->exifData(), request.out);
    if (image->pixelWidth() > 0 && image->pixelHeight() > 0) {
      request.out["KALOMDPixelWidth"] = std::to_string(image->pixelWidth());
      request.out["KALOMDPixelHeight"] = std::to_string(image->pixelHeight());
    }
    request.out["KALOMDMediaTypes"] = "Image";
    return true;
  } catch (const Exiv2::AnyError& e) {
    return Fail(request.problem, std::string("exiv2: ") + e.what());
  }
}

}  // namespace extract
}  // namespace orvex

// Audio with TagLib: the common tags of every format TagLib reads (ID3,
// Vorbis comments, MP4 atoms, APE, ASF, RIFF INFO) and the stream's length,
// bit rate, sample rate and channels. TagLib reads the tags and the first
// frames only, never the whole stream.
#include <taglib/fileref.h>
#include <taglib/mp4file.h>
#include <taglib/mp4properties.h>
#include <taglib/mpegfile.h>
#include <taglib/mpegproperties.h>
#include <taglib/tag.h>
#include <taglib/tpropertymap.h>

#include <string>

#include "extract_util.h"
#include "extractors.h"

namespace orvex {
namespace extract {
namespace {

std::string Utf8(const TagLib::String& text) { return text.to8Bit(/*unicode=*/true); }

// The codec of the stream, named as the index's other codecs are.
std::string CodecOf(const TagLib::FileRef& ref, const std::string& ext) {
  if (const auto* mpeg = dynamic_cast<const TagLib::MPEG::File*>(ref.file())) {
    const auto* properties = const_cast<TagLib::MPEG::File*>(mpeg)->audioProperties();
    if (properties != nullptr && properties->layer() >= 1 && properties->layer() <= 3) {
      return "mp" + std::to_string(properties->layer());
    }
    return "mp3";
  }
  if (const auto* mp4 = dynamic_cast<const TagLib::MP4::File*>(ref.file())) {
    const auto* properties = const_cast<TagLib::MP4::File*>(mp4)->audioProperties();
    if (properties != nullptr && properties->codec() == TagLib::MP4::Properties::ALAC) {
      return "alac";
    }
    return "aac";
  }
  static const std::pair<const char*, const char*> kByExtension[] = {
      {"flac", "flac"},    {"ogg", "vorbis"}, {"oga", "vorbis"}, {"opus", "opus"}, {"spx", "speex"},
      {"wav", "pcm"},      {"aif", "pcm"},    {"aiff", "pcm"},   {"wma", "wma"},   {"ape", "ape"},
      {"mpc", "musepack"}, {"wv", "wavpack"}, {"tta", "tta"},    {"aac", "aac"}};
  for (const auto& entry : kByExtension) {
    if (ext == entry.first) return entry.second;
  }
  return "";
}

void ReadTags(const TagLib::FileRef& ref, Json::Value& out) {
  const TagLib::Tag* tag = ref.tag();
  if (tag == nullptr) return;
  SetText(out, "KALOMDTitle", Utf8(tag->title()));
  SetText(out, "KALOMDAuthors", Utf8(tag->artist()));
  SetText(out, "KALOMDAlbum", Utf8(tag->album()));
  SetText(out, "KALOMDMusicalGenre", Utf8(tag->genre()));
  SetText(out, "KALOMDComment", Utf8(tag->comment()));
  SetPositiveInt(out, "KALOMDRecordingYear", tag->year());
  SetPositiveInt(out, "KALOMDAudioTrackNumber", tag->track());
  const TagLib::PropertyMap properties = ref.file()->properties();
  const auto composer = properties.find("COMPOSER");
  if (composer != properties.end()) {
    std::vector<std::string> names;
    for (const TagLib::String& name : composer->second) names.push_back(Utf8(name));
    SetTextList(out, "KALOMDComposer", names);
  }
}

// False when TagLib found no audio stream (no frame, no format chunk).
bool ReadStream(const TagLib::FileRef& ref, const std::string& ext, Json::Value& out) {
  const TagLib::AudioProperties* audio = ref.audioProperties();
  if (audio == nullptr || audio->sampleRate() <= 0) return false;
  if (audio->lengthInMilliseconds() > 0) {
    out["KALOMDDurationSecond"] = audio->lengthInMilliseconds() / 1000.0;
  }
  // TagLib counts kilobits per second; the index keeps bits per second.
  SetPositiveInt(out, "KALOMDAudioBitRate", int64_t{audio->bitrate()} * 1000);
  SetPositiveInt(out, "KALOMDTotalBitRate", int64_t{audio->bitrate()} * 1000);
  SetPositiveInt(out, "KALOMDAudioSampleRate", audio->sampleRate());
  SetPositiveInt(out, "KALOMDAudioChannelCount", audio->channels());
  SetText(out, "KALOMDCodecs", CodecOf(ref, ext));
  out["KALOMDMediaTypes"] = "Sound";
  return true;
}

}  // namespace

bool ExtractAudio(const ExtractRequest& request) {
  const TagLib::FileRef ref(request.path.c_str(), /*readAudioProperties=*/true,
                            TagLib::AudioProperties::Average);
  if (ref.isNull() || !ref.file()->isValid()) {
    return Fail(request.problem, "taglib: not a readable " + request.extension + " file");
  }
  ReadTags(ref, request.out);
  if (!ReadStream(ref, request.extension, request.out)) {
    return Fail(request.problem, "taglib: no audio stream in " + request.extension + " file");
  }
  return true;
}

}  // namespace extract
}  // namespace orvex

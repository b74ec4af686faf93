// Video with libavformat: the container's duration, bit rate and tags, and
// each stream's codec, bit rate, resolution (video) and sample rate and
// channels (audio). Probing reads a bounded prefix of the file; no frame is
// decoded.
extern "C" {
#include <libavcodec/avcodec.h>
#include <libavformat/avformat.h>
#include <libavutil/dict.h>
#include <libavutil/log.h>
}

#include <algorithm>
#include <mutex>
#include <string>
#include <vector>

#include "extract_util.h"
#include "extractors.h"

namespace orvex {
namespace extract {
namespace {

// How much of the file probing may read, and how much media time it may
// look at, before it settles for what it has.
constexpr const char* kProbeBytes = "5000000";
constexpr const char* kAnalyzeMicroseconds = "5000000";

std::string Tag(const AVDictionary* metadata, const char* key) {
  const AVDictionaryEntry* entry = av_dict_get(metadata, key, nullptr, 0);
  return entry == nullptr || entry->value == nullptr ? std::string() : entry->value;
}

void ReadTags(const AVFormatContext& context, Json::Value& out) {
  SetText(out, "KALOMDTitle", Tag(context.metadata, "title"));
  SetText(out, "KALOMDAuthors", Tag(context.metadata, "artist"));
  SetText(out, "KALOMDAlbum", Tag(context.metadata, "album"));
  SetText(out, "KALOMDComment", Tag(context.metadata, "comment"));
  SetText(out, "KALOMDMusicalGenre", Tag(context.metadata, "genre"));
  SetText(out, "KALOMDCreator", Tag(context.metadata, "encoder"));
  int64_t created = 0;
  if (ParseIsoDate(Tag(context.metadata, "creation_time"), &created) && created > 0) {
    SetInt(out, "KALOMDContentCreationDate", created);
  }
}

void ReadStreams(const AVFormatContext& context, Json::Value& out) {
  std::vector<std::string> codecs;
  bool video = false, audio = false;
  for (unsigned i = 0; i < context.nb_streams; ++i) {
    const AVStream* stream = context.streams[i];
    const AVCodecParameters* codec = stream->codecpar;
    // Cover art is stored as a one-picture video stream; it is not video.
    if (stream->disposition & AV_DISPOSITION_ATTACHED_PIC) continue;
    if (codec->codec_type == AVMEDIA_TYPE_VIDEO && !video) {
      video = true;
      SetPositiveInt(out, "KALOMDVideoBitRate", codec->bit_rate);
      if (codec->width > 0 && codec->height > 0) {
        out["KALOMDPixelWidth"] = std::to_string(codec->width);
        out["KALOMDPixelHeight"] = std::to_string(codec->height);
      }
    } else if (codec->codec_type == AVMEDIA_TYPE_AUDIO && !audio) {
      audio = true;
      SetPositiveInt(out, "KALOMDAudioBitRate", codec->bit_rate);
      SetPositiveInt(out, "KALOMDAudioSampleRate", codec->sample_rate);
      SetPositiveInt(out, "KALOMDAudioChannelCount", codec->ch_layout.nb_channels);
    } else if (codec->codec_type != AVMEDIA_TYPE_VIDEO && codec->codec_type != AVMEDIA_TYPE_AUDIO) {
      continue;
    }
    const std::string name = avcodec_get_name(codec->codec_id);
    if (std::find(codecs.begin(), codecs.end(), name) == codecs.end()) codecs.push_back(name);
  }
  std::string joined;
  for (const std::string& name : codecs) joined += (joined.empty() ? "" : " ") + name;
  SetText(out, "KALOMDCodecs", joined);
  if (video || audio) {
    out["KALOMDMediaTypes"] = video && audio ? "Video Sound" : (video ? "Video" : "Sound");
  }
}

}  // namespace

bool ExtractVideo(const ExtractRequest& request) {
  static std::once_flag quiet;
  std::call_once(quiet, [] { av_log_set_level(AV_LOG_QUIET); });
  AVDictionary* options = nullptr;
  av_dict_set(&options, "probesize", kProbeBytes, 0);
  av_dict_set(&options, "analyzeduration", kAnalyzeMicroseconds, 0);
  AVFormatContext* context = nullptr;
  const int status = avformat_open_input(&context, request.path.c_str(), nullptr, &options);
  av_dict_free(&options);
  if (status < 0) {
    char reason[AV_ERROR_MAX_STRING_SIZE] = {};
    av_strerror(status, reason, sizeof(reason));
    return Fail(request.problem, std::string("libavformat: ") + reason);
  }
  // Streams whose parameters the header leaves out are filled in by reading
  // a few packets; a file where that fails still has its header's facts.
  avformat_find_stream_info(context, nullptr);
  if (context->duration != AV_NOPTS_VALUE && context->duration > 0) {
    request.out["KALOMDDurationSecond"] = static_cast<double>(context->duration) / AV_TIME_BASE;
  }
  SetPositiveInt(request.out, "KALOMDTotalBitRate", context->bit_rate);
  ReadTags(*context, request.out);
  ReadStreams(*context, request.out);
  avformat_close_input(&context);
  return true;
}

}  // namespace extract
}  // namespace orvex

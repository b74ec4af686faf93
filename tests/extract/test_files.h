// Files the extraction tests make for themselves: a hand-written PDF, zip
// packages written with libarchive, texts re-encoded with the C library's
// iconv (not the ICU that the extractor uses), a bare JPEG given EXIF by
// Exiv2, MPEG audio frames, a PCM WAV, an AVI and a FLAC written by FFmpeg's
// libraries; the fixture that holds them, a helper that runs ExtractMetadata
// on one and one that compares the properties it gave.
#ifndef ORVEX_TESTS_EXTRACT_TEST_FILES_H_
#define ORVEX_TESTS_EXTRACT_TEST_FILES_H_

#include <archive.h>
#include <archive_entry.h>
#include <gtest/gtest.h>
#include <iconv.h>
#include <json/json.h>

#include <exiv2/exiv2.hpp>

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavformat/avformat.h>
}

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <functional>
#include <sstream>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "content_extractor.h"
#include "support/temp_dir.h"

namespace orvex {
namespace extract {
namespace testing {

struct Extraction {
  bool ok = false;
  std::string problem;
  Json::Value out;
};

// A fresh directory for one test's files.
class ExtractTest : public ::testing::Test {
 protected:
  orvex::testing::TempDir dir_;
};

// Expects each member of want (a JSON object literal) in out with that value,
// integers compared by value whatever their JSON type; a null member must be
// absent.
inline void ExpectMembers(const Json::Value& out, const std::string& want_text) {
  Json::Value want;
  std::istringstream in(want_text);
  std::string errors;
  ASSERT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), in, &want, &errors)) << errors;
  for (const std::string& name : want.getMemberNames()) {
    const Json::Value& expected = want[name];
    if (expected.isNull()) {
      EXPECT_FALSE(out.isMember(name)) << name;
    } else if (expected.isIntegral() && out[name].isIntegral()) {
      EXPECT_EQ(expected.asInt64(), out[name].asInt64()) << name;
    } else {
      EXPECT_EQ(expected, out[name]) << name;
    }
  }
}

inline Extraction Extract(const std::string& path, size_t max_text_bytes = 1 << 20) {
  ExtractLimits limits;
  limits.max_text_bytes = max_text_bytes;
  Extraction result;
  result.ok = ExtractMetadata(path, limits, result.out, &result.problem);
  return result;
}

// utf8 re-encoded in charset, by iconv.
inline std::string Encode(const std::string& utf8, const char* charset) {
  iconv_t cd = ::iconv_open(charset, "UTF-8");
  if (cd == reinterpret_cast<iconv_t>(-1)) throw std::runtime_error("iconv_open");
  std::string out(utf8.size() * 4 + 16, '\0');
  char* in = const_cast<char*>(utf8.data());
  size_t in_left = utf8.size();
  char* target = out.data();
  size_t out_left = out.size();
  const size_t rc = ::iconv(cd, &in, &in_left, &target, &out_left);
  ::iconv_close(cd);
  if (rc == static_cast<size_t>(-1)) throw std::runtime_error("iconv");
  out.resize(out.size() - out_left);
  return out;
}

// One zip entry: a name and either its content or, for large entries, a
// writer called with a function that appends bytes to the entry.
struct ZipEntry {
  using Generator = std::function<void(const std::function<void(const std::string&)>&)>;
  ZipEntry(std::string entry_name, std::string entry_content)
      : name(std::move(entry_name)), content(std::move(entry_content)) {}
  ZipEntry(std::string entry_name, int64_t entry_size, Generator generator)
      : name(std::move(entry_name)), size(entry_size), generate(std::move(generator)) {}

  std::string name;
  std::string content;
  int64_t size = -1;  // with generate: the entry's exact size
  Generator generate;
};

inline void WriteZip(const std::string& path, const std::vector<ZipEntry>& entries) {
  struct archive* zip = archive_write_new();
  archive_write_set_format_zip(zip);
  archive_write_zip_set_compression_deflate(zip);
  if (archive_write_open_filename(zip, path.c_str()) != ARCHIVE_OK) {
    throw std::runtime_error(std::string("zip: ") + archive_error_string(zip));
  }
  for (const ZipEntry& e : entries) {
    struct archive_entry* entry = archive_entry_new();
    archive_entry_set_pathname(entry, e.name.c_str());
    archive_entry_set_filetype(entry, AE_IFREG);
    archive_entry_set_perm(entry, 0644);
    archive_entry_set_size(entry, e.generate ? e.size : static_cast<int64_t>(e.content.size()));
    archive_write_header(zip, entry);
    if (e.generate) {
      e.generate(
          [&](const std::string& bytes) { archive_write_data(zip, bytes.data(), bytes.size()); });
    } else {
      archive_write_data(zip, e.content.data(), e.content.size());
    }
    archive_entry_free(entry);
  }
  archive_write_close(zip);
  archive_write_free(zip);
}

// A one-page PDF whose page shows text (in Helvetica) and whose document
// information dictionary is info (the inside of "<< >>"), with a correct
// cross-reference table.
inline std::string MinimalPdf(const std::string& info, const std::string& text) {
  const std::string stream = "BT /F1 24 Tf 72 700 Td (" + text + ") Tj ET";
  const std::vector<std::string> objects = {
      "<< /Type /Catalog /Pages 2 0 R >>",
      "<< /Type /Pages /Kids [3 0 R] /Count 1 >>",
      "<< /Type /Page /Parent 2 0 R /MediaBox [0 0 612 792] /Contents 4 0 R "
      "/Resources << /Font << /F1 5 0 R >> >> >>",
      "<< /Length " + std::to_string(stream.size()) + " >>\nstream\n" + stream + "\nendstream",
      "<< /Type /Font /Subtype /Type1 /BaseFont /Helvetica >>",
      "<< " + info + " >>",
  };
  std::string pdf = "%PDF-1.4\n";
  std::vector<size_t> offsets;
  for (size_t i = 0; i < objects.size(); ++i) {
    offsets.push_back(pdf.size());
    pdf += std::to_string(i + 1) + " 0 obj\n" + objects[i] + "\nendobj\n";
  }
  const size_t xref = pdf.size();
  pdf += "xref\n0 " + std::to_string(objects.size() + 1) + "\n0000000000 65535 f \n";
  for (size_t offset : offsets) {
    char line[32];
    std::snprintf(line, sizeof(line), "%010zu 00000 n \n", offset);
    pdf += line;
  }
  pdf += "trailer\n<< /Size " + std::to_string(objects.size() + 1) +
         " /Root 1 0 R /Info 6 0 R >>\nstartxref\n" + std::to_string(xref) + "\n%%EOF\n";
  return pdf;
}

inline void PutBig16(std::string& s, unsigned v) {
  s += static_cast<char>(v >> 8);
  s += static_cast<char>(v & 0xFF);
}

// A baseline JPEG of width x height with its headers only (no Huffman
// tables, one byte of scan data): enough for metadata readers, which never
// decode the picture.
inline std::string MinimalJpeg(unsigned width, unsigned height) {
  std::string jpeg("\xFF\xD8", 2);
  jpeg += std::string("\xFF\xE0\x00\x10JFIF\x00\x01\x01\x00\x00\x01\x00\x01\x00\x00", 18);
  jpeg += std::string("\xFF\xDB\x00\x43\x00", 5) + std::string(64, '\x01');
  jpeg += std::string("\xFF\xC0\x00\x0B\x08", 5);
  PutBig16(jpeg, height);
  PutBig16(jpeg, width);
  jpeg += std::string("\x01\x01\x11\x00", 4);
  jpeg += std::string("\xFF\xDA\x00\x08\x01\x01\x00\x00\x3F\x00", 10);
  jpeg += std::string("\x00\xFF\xD9", 3);
  return jpeg;
}

// frames MPEG-1 Layer III frames at 128 kbit/s, 44.1 kHz, stereo: 417 bytes
// each (a header and silence), 1152 samples each.
inline std::string Mp3Frames(int frames) {
  std::string frame("\xFF\xFB\x90\x00", 4);
  frame.resize(417, '\0');
  std::string audio;
  for (int i = 0; i < frames; ++i) audio += frame;
  return audio;
}

inline void PutLittle(std::string& s, uint32_t v, int bytes) {
  for (int i = 0; i < bytes; ++i) s += static_cast<char>((v >> (8 * i)) & 0xFF);
}

// A PCM WAV file of silence: 16-bit samples.
inline std::string PcmWav(uint32_t sample_rate, uint16_t channels, uint32_t seconds) {
  const uint32_t data_bytes = sample_rate * channels * 2 * seconds;
  std::string wav = "RIFF";
  PutLittle(wav, 36 + data_bytes, 4);
  wav += "WAVEfmt ";
  PutLittle(wav, 16, 4);
  PutLittle(wav, 1, 2);  // PCM
  PutLittle(wav, channels, 2);
  PutLittle(wav, sample_rate, 4);
  PutLittle(wav, sample_rate * channels * 2, 4);
  PutLittle(wav, channels * 2, 2);
  PutLittle(wav, 16, 2);
  wav += "data";
  PutLittle(wav, data_bytes, 4);
  wav.append(data_bytes, '\0');
  return wav;
}

inline std::string SyncSafe(uint32_t v) {
  std::string s;
  for (int shift = 21; shift >= 0; shift -= 7) s += static_cast<char>((v >> shift) & 0x7F);
  return s;
}

// An ID3v2.3 tag written by hand from (frame id, frame body) pairs.
inline std::string Id3v23(const std::vector<std::pair<std::string, std::string>>& frames) {
  std::string body;
  for (const auto& frame : frames) {
    body += frame.first;
    const uint32_t size = static_cast<uint32_t>(frame.second.size());
    for (int shift = 24; shift >= 0; shift -= 8) body += static_cast<char>((size >> shift) & 0xFF);
    body += std::string("\0\0", 2);
    body += frame.second;
  }
  return std::string("ID3\x03\x00\x00", 6) + SyncSafe(static_cast<uint32_t>(body.size())) + body;
}

// Gives the image at path a full set of EXIF camera settings and a GPS
// position.
inline void WriteExif(const std::string& path) {
  Exiv2::Image::AutoPtr image = Exiv2::ImageFactory::open(path);
  image->readMetadata();
  Exiv2::ExifData exif;
  exif["Exif.Image.Make"] = "OrvexCam";
  exif["Exif.Image.Model"] = "X100 Mark II";
  exif["Exif.Image.Orientation"] = uint16_t{6};
  exif["Exif.Image.XResolution"] = Exiv2::URational(300, 1);
  exif["Exif.Image.YResolution"] = Exiv2::URational(240, 1);
  exif["Exif.Image.ResolutionUnit"] = uint16_t{2};
  exif["Exif.Image.Artist"] = "Ansel";
  exif["Exif.Photo.ExposureTime"] = Exiv2::URational(1, 250);
  exif["Exif.Photo.FNumber"] = Exiv2::URational(28, 10);
  exif["Exif.Photo.ISOSpeedRatings"] = uint16_t{400};
  exif["Exif.Photo.FocalLength"] = Exiv2::URational(35, 1);
  exif["Exif.Photo.LensModel"] = "Orvex 35mm F1.4";
  exif["Exif.Photo.DateTimeOriginal"] = "2023:07:14 09:30:00";
  exif["Exif.GPSInfo.GPSLatitudeRef"] = "N";
  exif["Exif.GPSInfo.GPSLatitude"] = "35/1 39/1 2916/100";
  exif["Exif.GPSInfo.GPSLongitudeRef"] = "E";
  exif["Exif.GPSInfo.GPSLongitude"] = "139/1 44/1 288/10";
  image->setExifData(exif);
  image->writeMetadata();
}

// An AVI of one second: 32x16 motion JPEG at 10 frames a second and 8 kHz
// mono PCM, titled.
inline void WriteAvi(const std::string& path) {
  const auto check = [](bool ok, const char* what) {
    if (!ok) throw std::runtime_error(std::string("avi: ") + what);
  };
  AVFormatContext* context = nullptr;
  check(avformat_alloc_output_context2(&context, nullptr, "avi", path.c_str()) >= 0,
        "avformat_alloc_output_context2");
  AVStream* video = avformat_new_stream(context, nullptr);
  video->codecpar->codec_type = AVMEDIA_TYPE_VIDEO;
  video->codecpar->codec_id = AV_CODEC_ID_MJPEG;
  video->codecpar->width = 32;
  video->codecpar->height = 16;
  video->time_base = AVRational{1, 10};
  AVStream* audio = avformat_new_stream(context, nullptr);
  audio->codecpar->codec_type = AVMEDIA_TYPE_AUDIO;
  audio->codecpar->codec_id = AV_CODEC_ID_PCM_S16LE;
  audio->codecpar->sample_rate = 8000;
  av_channel_layout_default(&audio->codecpar->ch_layout, 1);
  audio->codecpar->bits_per_coded_sample = 16;
  audio->codecpar->block_align = 2;
  audio->codecpar->bit_rate = 128000;
  audio->time_base = AVRational{1, 8000};
  av_dict_set(&context->metadata, "title", "Holiday clip", 0);
  check(avio_open(&context->pb, path.c_str(), AVIO_FLAG_WRITE) >= 0, "avio_open");
  check(avformat_write_header(context, nullptr) >= 0, "avformat_write_header");
  for (int i = 0; i < 10; ++i) {
    const std::string pixels = MinimalJpeg(32, 16);
    AVPacket* packet = av_packet_alloc();
    av_new_packet(packet, static_cast<int>(pixels.size()));
    std::copy(pixels.begin(), pixels.end(), packet->data);
    packet->stream_index = video->index;
    packet->pts = packet->dts = av_rescale_q(i, AVRational{1, 10}, video->time_base);
    packet->flags |= AV_PKT_FLAG_KEY;
    check(av_interleaved_write_frame(context, packet) >= 0, "av_interleaved_write_frame");
    av_packet_free(&packet);
    packet = av_packet_alloc();
    av_new_packet(packet, 800 * 2);
    std::fill(packet->data, packet->data + 1600, 0);
    packet->stream_index = audio->index;
    packet->pts = packet->dts = av_rescale_q(i * 800, AVRational{1, 8000}, audio->time_base);
    check(av_interleaved_write_frame(context, packet) >= 0, "av_interleaved_write_frame");
    av_packet_free(&packet);
  }
  check(av_write_trailer(context) >= 0, "av_write_trailer");
  avio_closep(&context->pb);
  avformat_free_context(context);
}

// A FLAC file of `seconds` of mono silence at 44.1 kHz, encoded by
// libavcodec's FLAC encoder and written by libavformat.
inline void WriteFlac(const std::string& path, int seconds) {
  const auto check = [](bool ok, const char* what) {
    if (!ok) throw std::runtime_error(std::string("flac: ") + what);
  };
  const AVCodec* codec = avcodec_find_encoder(AV_CODEC_ID_FLAC);
  check(codec != nullptr, "no encoder");
  AVCodecContext* encoder = avcodec_alloc_context3(codec);
  encoder->sample_fmt = AV_SAMPLE_FMT_S16;
  encoder->sample_rate = 44100;
  av_channel_layout_default(&encoder->ch_layout, 1);
  encoder->time_base = AVRational{1, 44100};
  check(avcodec_open2(encoder, codec, nullptr) >= 0, "avcodec_open2");
  AVFormatContext* context = nullptr;
  check(avformat_alloc_output_context2(&context, nullptr, "flac", path.c_str()) >= 0, "muxer");
  AVStream* stream = avformat_new_stream(context, nullptr);
  avcodec_parameters_from_context(stream->codecpar, encoder);
  stream->time_base = encoder->time_base;
  check(avio_open(&context->pb, path.c_str(), AVIO_FLAG_WRITE) >= 0, "avio_open");
  check(avformat_write_header(context, nullptr) >= 0, "avformat_write_header");
  AVPacket* packet = av_packet_alloc();
  const auto drain = [&] {
    while (avcodec_receive_packet(encoder, packet) == 0) {
      packet->stream_index = stream->index;
      av_packet_rescale_ts(packet, encoder->time_base, stream->time_base);
      check(av_interleaved_write_frame(context, packet) >= 0, "write frame");
    }
  };
  AVFrame* frame = av_frame_alloc();
  const int total = 44100 * seconds;
  for (int done = 0; done < total; done += encoder->frame_size) {
    frame->nb_samples = std::min(encoder->frame_size, total - done);
    frame->format = encoder->sample_fmt;
    av_channel_layout_copy(&frame->ch_layout, &encoder->ch_layout);
    check(av_frame_get_buffer(frame, 0) >= 0, "av_frame_get_buffer");
    std::fill_n(frame->data[0], frame->nb_samples * 2, uint8_t{0});
    frame->pts = done;
    check(avcodec_send_frame(encoder, frame) >= 0, "avcodec_send_frame");
    av_frame_unref(frame);
    drain();
  }
  avcodec_send_frame(encoder, nullptr);
  drain();
  check(av_write_trailer(context) >= 0, "av_write_trailer");
  av_frame_free(&frame);
  av_packet_free(&packet);
  avio_closep(&context->pb);
  avformat_free_context(context);
  avcodec_free_context(&encoder);
}

}  // namespace testing
}  // namespace extract
}  // namespace orvex

#endif  // ORVEX_TESTS_EXTRACT_TEST_FILES_H_

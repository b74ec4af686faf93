// Songs, photos and videos made by the test: MPEG audio frames, a WAV and a
// FLAC tagged by TagLib or by a hand-written ID3 tag, a bare JPEG given EXIF by
// Exiv2, an AVI written by libavformat.
#include <gtest/gtest.h>
#include <taglib/flacfile.h>
#include <taglib/id3v2tag.h>
#include <taglib/mpegfile.h>
#include <taglib/tpropertymap.h>
#include <taglib/wavfile.h>
#include <taglib/xiphcomment.h>

#include <functional>
#include <string>
#include <vector>

#include "extract/test_files.h"

namespace orvex {
namespace extract {
namespace {

using testing::ExpectMembers;
using testing::Extract;
using MediaTest = testing::ExtractTest;

void TagWithTagLib(TagLib::Tag* tag) {
  tag->setTitle(TagLib::String("Caf\xC3\xA9 Song", TagLib::String::UTF8));
  tag->setArtist("The Testers");
  tag->setAlbum("Greatest Hits");
  tag->setGenre("Jazz");
  tag->setComment("recorded live");
  tag->setYear(1999);
  tag->setTrack(7);
}

// What TagWithTagLib wrote, as the extractor gives it back.
const char kTags[] = R"({"KALOMDTitle": "Café Song", "KALOMDAuthors": "The Testers",
    "KALOMDAlbum": "Greatest Hits", "KALOMDMusicalGenre": "Jazz",
    "KALOMDComment": "recorded live", "KALOMDRecordingYear": 1999, "KALOMDAudioTrackNumber": 7,
    "KALOMDMediaTypes": "Sound"})";

TEST_F(MediaTest, SongsTaggedByTagLibGiveTheirTagsAndStreams) {
  struct Case {
    const char* name;
    std::function<void(const std::string&)> make;  // writes and tags the file
    double seconds, tolerance;
    const char* stream;
  };
  const Case cases[] = {
      {"song.mp3",
       [&](const std::string& path) {
         dir_.Write("song.mp3", testing::Mp3Frames(100));
         TagLib::MPEG::File file(path.c_str());
         TagWithTagLib(file.ID3v2Tag(/*create=*/true));
         TagLib::PropertyMap properties = file.properties();
         properties.insert("COMPOSER", TagLib::StringList("J. S. Bach"));
         file.setProperties(properties);
         ASSERT_TRUE(file.save());
       },
       100 * 1152 / 44100.0, 0.05,  // 100 frames of 1152 samples at 44.1 kHz
       R"({"KALOMDComposer": "J. S. Bach", "KALOMDAudioBitRate": 128000,
           "KALOMDAudioSampleRate": 44100, "KALOMDAudioChannelCount": 2, "KALOMDCodecs": "mp3"})"},
      {"take.wav",
       [&](const std::string& path) {
         dir_.Write("take.wav", testing::PcmWav(8000, 1, 2));
         TagLib::RIFF::WAV::File file(path.c_str());
         TagWithTagLib(file.ID3v2Tag());
         ASSERT_TRUE(file.save());
       },
       2.0, 0.01,  // the bit rate is 8000 x 16 bits
       R"({"KALOMDAudioBitRate": 128000, "KALOMDAudioSampleRate": 8000,
           "KALOMDAudioChannelCount": 1, "KALOMDCodecs": "pcm"})"},
      {"track.flac",
       [](const std::string& path) {
         testing::WriteFlac(path, 3);
         TagLib::FLAC::File file(path.c_str());
         TagWithTagLib(file.xiphComment(/*create=*/true));
         file.xiphComment()->addField("COMPOSER", "Clara Schumann");
         ASSERT_TRUE(file.save());
       },
       3.0, 0.01,
       R"({"KALOMDComposer": "Clara Schumann", "KALOMDAudioSampleRate": 44100,
           "KALOMDAudioChannelCount": 1, "KALOMDCodecs": "flac"})"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const std::string path = dir_.Join(c.name);
    c.make(path);
    const auto result = Extract(path);
    ASSERT_TRUE(result.ok) << result.problem;
    ExpectMembers(result.out, kTags);
    ExpectMembers(result.out, c.stream);
    ASSERT_TRUE(result.out["KALOMDDurationSecond"].isDouble());
    EXPECT_NEAR(c.seconds, result.out["KALOMDDurationSecond"].asDouble(), c.tolerance);
  }
}

TEST_F(MediaTest, Mp3WithAHandWrittenId3Tag) {
  // Title in Latin-1, artist in UTF-16 with a byte-order mark.
  const std::string tag = testing::Id3v23({
      {"TIT2", std::string("\x00", 1) + "Caf\xE9"},
      {"TPE1", std::string("\x01\xFF\xFE", 3) + testing::Encode("Zo\xC3\xAB", "UTF-16LE")},
      {"TALB", std::string("\x00", 1) + "Album"},
      {"TYER", std::string("\x00", 1) + "2001"},
      {"TRCK", std::string("\x00", 1) + "3/12"},
  });
  const auto result = Extract(dir_.Write("hand.mp3", tag + testing::Mp3Frames(50)));
  ASSERT_TRUE(result.ok) << result.problem;
  ExpectMembers(result.out, R"({"KALOMDTitle": "Café", "KALOMDAuthors": "Zoë",
      "KALOMDAlbum": "Album", "KALOMDRecordingYear": 2001, "KALOMDAudioTrackNumber": 3,
      "KALOMDComment": null})");
}

TEST_F(MediaTest, JpegWithExifAndWithout) {
  const std::string path = dir_.Write("photo.jpg", testing::MinimalJpeg(32, 16));
  testing::WriteExif(path);
  const auto result = Extract(path);
  ASSERT_TRUE(result.ok) << result.problem;
  ExpectMembers(result.out, R"({"KALOMDAcquisitionMake": "OrvexCam",
      "KALOMDAcquisitionModel": "X100 Mark II", "KALOMDExposureTimeString": "1/250",
      "KALOMDAperture": "2.8", "KALOMDISOSpeed": 400, "KALOMDResolutionWidthDPI": 300,
      "KALOMDResolutionHeightDPI": 240, "KALOMDContentCreationDate": 1689327000,
      "KALOMDAuthors": "Ansel", "KALOMDLensModel": "Orvex 35mm F1.4", "KALOMDFocalLength": "35",
      "KALOMDOrientation": "6", "KALOMDPixelWidth": "32", "KALOMDPixelHeight": "16",
      "KALOMDLatitude": "35.658100", "KALOMDLongitude": "139.741333",
      "KALOMDMediaTypes": "Image"})");
  const auto plain = Extract(dir_.Write("plain.jpeg", testing::MinimalJpeg(640, 480)));
  ASSERT_TRUE(plain.ok) << plain.problem;
  ExpectMembers(plain.out, R"({"KALOMDPixelWidth": "640", "KALOMDPixelHeight": "480",
      "KALOMDAcquisitionMake": null, "KALOMDContentCreationDate": null})");
}

TEST_F(MediaTest, AviGivesStreamsAndDuration) {
  const std::string path = dir_.Join("clip.avi");
  testing::WriteAvi(path);
  const auto result = Extract(path);
  ASSERT_TRUE(result.ok) << result.problem;
  ExpectMembers(result.out, R"({"KALOMDTitle": "Holiday clip", "KALOMDPixelWidth": "32",
      "KALOMDPixelHeight": "16", "KALOMDCodecs": "mjpeg pcm_s16le", "KALOMDAudioSampleRate": 8000,
      "KALOMDAudioChannelCount": 1, "KALOMDAudioBitRate": 128000,
      "KALOMDMediaTypes": "Video Sound"})");
  EXPECT_NEAR(1.0, result.out["KALOMDDurationSecond"].asDouble(), 0.15);
}

}  // namespace
}  // namespace extract
}  // namespace orvex

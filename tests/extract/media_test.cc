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

#include <string>
#include <vector>

#include "extract/test_files.h"
#include "support/temp_dir.h"

namespace orvex {
namespace extract {
namespace {

using testing::Extract;

class MediaTest : public ::testing::Test {
 protected:
  orvex::testing::TempDir dir_;
};

void TagWithTagLib(TagLib::Tag* tag) {
  tag->setTitle(TagLib::String("Caf\xC3\xA9 Song", TagLib::String::UTF8));
  tag->setArtist("The Testers");
  tag->setAlbum("Greatest Hits");
  tag->setGenre("Jazz");
  tag->setComment("recorded live");
  tag->setYear(1999);
  tag->setTrack(7);
}

void ExpectTags(const Json::Value& out) {
  EXPECT_EQ("Caf\xC3\xA9 Song", out["KALOMDTitle"].asString());
  EXPECT_EQ("The Testers", out["KALOMDAuthors"].asString());
  EXPECT_EQ("Greatest Hits", out["KALOMDAlbum"].asString());
  EXPECT_EQ("Jazz", out["KALOMDMusicalGenre"].asString());
  EXPECT_EQ("recorded live", out["KALOMDComment"].asString());
  ASSERT_TRUE(out["KALOMDRecordingYear"].isIntegral());
  EXPECT_EQ(1999, out["KALOMDRecordingYear"].asInt());
  EXPECT_EQ(7, out["KALOMDAudioTrackNumber"].asInt());
  EXPECT_EQ("Sound", out["KALOMDMediaTypes"].asString());
}

TEST_F(MediaTest, Mp3TaggedByTagLib) {
  const std::string path = dir_.Write("song.mp3", testing::Mp3Frames(100));
  {
    TagLib::MPEG::File file(path.c_str());
    ASSERT_TRUE(file.isValid());
    TagWithTagLib(file.ID3v2Tag(/*create=*/true));
    TagLib::PropertyMap properties = file.properties();
    properties.insert("COMPOSER", TagLib::StringList("J. S. Bach"));
    file.setProperties(properties);
    ASSERT_TRUE(file.save());
  }
  const auto result = Extract(path);
  ASSERT_TRUE(result.ok) << result.problem;
  const Json::Value& out = result.out;
  ExpectTags(out);
  EXPECT_EQ("J. S. Bach", out["KALOMDComposer"].asString());
  ASSERT_TRUE(out["KALOMDDurationSecond"].isDouble());
  // 100 frames of 1152 samples at 44.1 kHz.
  EXPECT_NEAR(100 * 1152 / 44100.0, out["KALOMDDurationSecond"].asDouble(), 0.05);
  EXPECT_EQ(128000, out["KALOMDAudioBitRate"].asInt());
  EXPECT_EQ(44100, out["KALOMDAudioSampleRate"].asInt());
  EXPECT_EQ(2, out["KALOMDAudioChannelCount"].asInt());
  EXPECT_EQ("mp3", out["KALOMDCodecs"].asString());
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
  const Json::Value& out = result.out;
  EXPECT_EQ("Caf\xC3\xA9", out["KALOMDTitle"].asString());
  EXPECT_EQ("Zo\xC3\xAB", out["KALOMDAuthors"].asString());
  EXPECT_EQ("Album", out["KALOMDAlbum"].asString());
  EXPECT_EQ(2001, out["KALOMDRecordingYear"].asInt());
  EXPECT_EQ(3, out["KALOMDAudioTrackNumber"].asInt());
  EXPECT_FALSE(out.isMember("KALOMDComment"));
}

TEST_F(MediaTest, WavTaggedByTagLib) {
  const std::string path = dir_.Write("take.wav", testing::PcmWav(8000, 1, 2));
  {
    TagLib::RIFF::WAV::File file(path.c_str());
    ASSERT_TRUE(file.isValid());
    TagWithTagLib(file.ID3v2Tag());
    ASSERT_TRUE(file.save());
  }
  const auto result = Extract(path);
  ASSERT_TRUE(result.ok) << result.problem;
  const Json::Value& out = result.out;
  ExpectTags(out);
  EXPECT_NEAR(2.0, out["KALOMDDurationSecond"].asDouble(), 0.01);
  EXPECT_EQ(128000, out["KALOMDAudioBitRate"].asInt());  // 8000 x 16 bits
  EXPECT_EQ(8000, out["KALOMDAudioSampleRate"].asInt());
  EXPECT_EQ(1, out["KALOMDAudioChannelCount"].asInt());
  EXPECT_EQ("pcm", out["KALOMDCodecs"].asString());
}

TEST_F(MediaTest, FlacWithVorbisComments) {
  const std::string path = dir_.Join("track.flac");
  testing::WriteFlac(path, 3);
  {
    TagLib::FLAC::File file(path.c_str());
    ASSERT_TRUE(file.isValid());
    TagWithTagLib(file.xiphComment(/*create=*/true));
    file.xiphComment()->addField("COMPOSER", "Clara Schumann");
    ASSERT_TRUE(file.save());
  }
  const auto result = Extract(path);
  ASSERT_TRUE(result.ok) << result.problem;
  const Json::Value& out = result.out;
  ExpectTags(out);
  EXPECT_EQ("Clara Schumann", out["KALOMDComposer"].asString());
  EXPECT_NEAR(3.0, out["KALOMDDurationSecond"].asDouble(), 0.01);
  EXPECT_EQ(44100, out["KALOMDAudioSampleRate"].asInt());
  EXPECT_EQ(1, out["KALOMDAudioChannelCount"].asInt());
  EXPECT_EQ("flac", out["KALOMDCodecs"].asString());
}

TEST_F(MediaTest, JpegWithExif) {
  const std::string path = dir_.Write("photo.jpg", testing::MinimalJpeg(32, 16));
  testing::WriteExif(path);
  const auto result = Extract(path);
  ASSERT_TRUE(result.ok) << result.problem;
  const Json::Value& out = result.out;
  EXPECT_EQ("OrvexCam", out["KALOMDAcquisitionMake"].asString());
  EXPECT_EQ("X100 Mark II", out["KALOMDAcquisitionModel"].asString());
  EXPECT_EQ("1/250", out["KALOMDExposureTimeString"].asString());
  EXPECT_EQ("2.8", out["KALOMDAperture"].asString());
  ASSERT_TRUE(out["KALOMDISOSpeed"].isIntegral());
  EXPECT_EQ(400, out["KALOMDISOSpeed"].asInt());
  EXPECT_EQ(300, out["KALOMDResolutionWidthDPI"].asInt());
  EXPECT_EQ(240, out["KALOMDResolutionHeightDPI"].asInt());
  EXPECT_EQ(1689327000, out["KALOMDContentCreationDate"].asInt64());
  EXPECT_EQ("Ansel", out["KALOMDAuthors"].asString());
  EXPECT_EQ("Orvex 35mm F1.4", out["KALOMDLensModel"].asString());
  EXPECT_EQ("35", out["KALOMDFocalLength"].asString());
  EXPECT_EQ("6", out["KALOMDOrientation"].asString());
  EXPECT_EQ("32", out["KALOMDPixelWidth"].asString());
  EXPECT_EQ("16", out["KALOMDPixelHeight"].asString());
  EXPECT_EQ("35.658100", out["KALOMDLatitude"].asString());
  EXPECT_EQ("139.741333", out["KALOMDLongitude"].asString());
  EXPECT_EQ("Image", out["KALOMDMediaTypes"].asString());
}

TEST_F(MediaTest, JpegWithoutExifGivesItsSizeOnly) {
  const auto result = Extract(dir_.Write("plain.jpeg", testing::MinimalJpeg(640, 480)));
  ASSERT_TRUE(result.ok) << result.problem;
  EXPECT_EQ("640", result.out["KALOMDPixelWidth"].asString());
  EXPECT_EQ("480", result.out["KALOMDPixelHeight"].asString());
  EXPECT_FALSE(result.out.isMember("KALOMDAcquisitionMake"));
  EXPECT_FALSE(result.out.isMember("KALOMDContentCreationDate"));
}

TEST_F(MediaTest, AviGivesStreamsAndDuration) {
  const std::string path = dir_.Join("clip.avi");
  testing::WriteAvi(path);
  const auto result = Extract(path);
  ASSERT_TRUE(result.ok) << result.problem;
  const Json::Value& out = result.out;
  EXPECT_EQ("Holiday clip", out["KALOMDTitle"].asString());
  EXPECT_NEAR(1.0, out["KALOMDDurationSecond"].asDouble(), 0.15);
  EXPECT_EQ("32", out["KALOMDPixelWidth"].asString());
  EXPECT_EQ("16", out["KALOMDPixelHeight"].asString());
  EXPECT_EQ("mjpeg pcm_s16le", out["KALOMDCodecs"].asString());
  EXPECT_EQ(8000, out["KALOMDAudioSampleRate"].asInt());
  EXPECT_EQ(1, out["KALOMDAudioChannelCount"].asInt());
  EXPECT_EQ(128000, out["KALOMDAudioBitRate"].asInt());
  EXPECT_EQ("Video Sound", out["KALOMDMediaTypes"].asString());
}

}  // namespace
}  // namespace extract
}  // namespace orvex

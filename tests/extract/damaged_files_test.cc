// Zero-length, garbage and truncated files of every type: each gives false
// with a problem or true with nothing made up, and none crashes.
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <random>
#include <string>
#include <vector>

#include "extract/test_files.h"

namespace orvex {
namespace extract {
namespace {

using testing::Extract;

class DamagedFilesTest : public testing::ExtractTest {
 protected:
  // The bytes of a sound file of type ext, which the extractor reads
  // without a problem.
  std::string Sound(const std::string& ext) {
    const std::string path = dir_.Join("sound." + ext);
    if (ext == "pdf") {
      dir_.Write("sound.pdf", testing::MinimalPdf("/Title (Cut short) /Author (Me)", "Some text"));
    } else if (ext == "jpg") {
      dir_.Write("sound.jpg", testing::MinimalJpeg(64, 64));
      testing::WriteExif(path);
    } else if (ext == "mp3") {
      dir_.Write("sound.mp3", testing::Id3v23({{"TIT2", std::string("\0Title", 6)},
                                               {"TPE1", std::string("\0Artist", 7)}}) +
                                  testing::Mp3Frames(20));
    } else if (ext == "wav") {
      dir_.Write("sound.wav", testing::PcmWav(8000, 1, 1));
    } else if (ext == "avi") {
      testing::WriteAvi(path);
    } else if (ext == "flac") {
      testing::WriteFlac(path, 1);
    } else if (ext == "html") {
      dir_.Write("sound.html", "<html><head><title>T</title></head><body><p>text</p></body>");
    } else if (ext == "txt") {
      dir_.Write("sound.txt", "plain text\n");
    } else {
      const std::string part = "<document><p>" + std::string(4000, 'x') + "</p></document>";
      const std::vector<testing::ZipEntry> parts =
          ext == "docx"
              ? std::vector<testing::ZipEntry>{{"word/document.xml", part},
                                               {"docProps/core.xml", "<cp><title>T</title></cp>"}}
          : ext == "odt" ? std::vector<testing::ZipEntry>{{"content.xml", part},
                                                          {"meta.xml", "<m><title>T</title></m>"}}
                         : std::vector<testing::ZipEntry>{
                               {"META-INF/container.xml",
                                "<container><rootfile full-path=\"c.opf\"/></container>"},
                               {"c.opf",
                                "<package><metadata><title>T</title></metadata><manifest><item "
                                "id=\"a\" href=\"a.xhtml\"/></manifest><spine><itemref "
                                "idref=\"a\"/></spine></package>"},
                               {"a.xhtml", "<html><body>" + part + "</body></html>"}};
      testing::WriteZip(path, parts);
    }
    std::ifstream in(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
  }
};

const std::vector<std::string> kSoundTypes = {"pdf", "docx", "odt", "epub", "html", "mp3",
                                              "wav", "flac", "jpg", "avi",  "txt"};

const std::vector<std::string> kTypes = {"pdf",  "docx", "xlsx", "pptx", "odt", "ods", "epub",
                                         "html", "mp3",  "wav",  "flac", "ogg", "m4a", "jpg",
                                         "png",  "tif",  "mp4",  "mkv",  "avi", "txt"};

TEST_F(DamagedFilesTest, ZeroLengthAndGarbageGiveNothingOrAProblem) {
  std::mt19937 random(20241124);
  std::string garbage(8192, '\0');
  for (char& c : garbage) c = static_cast<char>(random());
  for (const std::string& ext : kTypes) {
    if (ext == "txt") continue;  // any bytes are some text
    for (const auto& content : {std::string(), garbage}) {
      SCOPED_TRACE("." + ext + (content.empty() ? " zero-length" : " garbage"));
      const auto result = Extract(dir_.Write("bad." + ext, content));
      if (result.ok) {
        EXPECT_TRUE(result.out.empty()) << result.out.toStyledString();
      } else {
        EXPECT_FALSE(result.problem.empty());
      }
    }
  }
}

TEST_F(DamagedFilesTest, SoundFilesAreReadWithoutAProblem) {
  for (const std::string& ext : kSoundTypes) {
    SCOPED_TRACE("." + ext);
    const std::string bytes = Sound(ext);
    const auto result = Extract(dir_.Join("sound." + ext));
    EXPECT_TRUE(result.ok) << result.problem;
    EXPECT_FALSE(result.out.empty());
  }
}

TEST_F(DamagedFilesTest, TruncatedFilesNeverCrash) {
  for (const std::string& ext : kSoundTypes) {
    const std::string whole = Sound(ext);
    for (size_t keep : {whole.size() - 1, whole.size() / 2, whole.size() / 10, size_t{10}}) {
      SCOPED_TRACE("." + ext + " cut to " + std::to_string(keep) + " of " +
                   std::to_string(whole.size()) + " bytes");
      const auto result = Extract(dir_.Write("cut." + ext, whole.substr(0, keep)));
      if (!result.ok) {
        EXPECT_FALSE(result.problem.empty());
      }
      EXPECT_TRUE(result.out.isObject());
    }
  }
}

// Seeded random damage: bytes overwritten in place, runs zeroed, a block
// repeated. The extractor must come back, and say why when it fails.
TEST_F(DamagedFilesTest, CorruptedFilesNeverCrash) {
  std::mt19937 random(7);
  for (const std::string& ext : kSoundTypes) {
    const std::string whole = Sound(ext);
    for (int round = 0; round < 40; ++round) {
      std::string bytes = whole;
      const auto at = [&] { return static_cast<size_t>(random() % bytes.size()); };
      switch (round % 3) {
        case 0:
          for (int i = 0; i < 1 + round % 8; ++i) bytes[at()] = static_cast<char>(random());
          break;
        case 1: {
          const size_t start = at();
          std::fill(bytes.begin() + start,
                    bytes.begin() + std::min(bytes.size(), start + 1 + random() % 64), '\0');
          break;
        }
        default: {
          const size_t start = at();
          bytes.insert(at(), bytes.substr(start, 1 + random() % 256));
          break;
        }
      }
      SCOPED_TRACE("." + ext + " round " + std::to_string(round));
      const auto result = Extract(dir_.Write("corrupt." + ext, bytes));
      if (!result.ok) {
        EXPECT_FALSE(result.problem.empty());
      }
      EXPECT_TRUE(result.out.isObject());
    }
  }
}

TEST_F(DamagedFilesTest, BrokenXmlPartIsAProblemButKeepsWhatWasRead) {
  const std::string path = dir_.Join("broken.docx");
  testing::WriteZip(path, {{"word/document.xml",
                            "<w:document xmlns:w=\"w\"><w:body><w:p><w:r><w:t>kept</w:t>"
                            "</w:r></w:p><w:p></w:r></w:body></w:document>"},
                           {"docProps/core.xml", "<cp><title>Still here</title></cp>"}});
  const auto result = Extract(path);
  EXPECT_FALSE(result.ok);
  EXPECT_NE(std::string::npos, result.problem.find("word/document.xml")) << result.problem;
  EXPECT_EQ("kept", result.out["KALOMDTextContent"].asString());
  EXPECT_EQ("Still here", result.out["KALOMDTitle"].asString());
}

TEST_F(DamagedFilesTest, PackageWithoutItsMainPartIsAProblem) {
  struct Case {
    const char* name;
    const char* part;
  };
  for (const Case& c : {Case{"a.docx", "word/other.xml"}, Case{"a.odt", "styles.xml"},
                        Case{"a.epub", "OEBPS/ch1.xhtml"}, Case{"a.pptx", "ppt/slides/x.xml"}}) {
    SCOPED_TRACE(c.name);
    const std::string path = dir_.Join(c.name);
    testing::WriteZip(path, {{c.part, "<x/>"}});
    const auto result = Extract(path);
    EXPECT_FALSE(result.ok);
    EXPECT_FALSE(result.problem.empty());
  }
}

}  // namespace
}  // namespace extract
}  // namespace orvex

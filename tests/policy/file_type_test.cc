#include "orvex/policy/file_type.h"

#include <gtest/gtest.h>

#include <cctype>
#include <string>
#include <vector>

namespace orvex {
namespace fileindex {
namespace {

std::string Upper(std::string s) {
  for (char& c : s) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
  return s;
}

TEST(GetFileTypeByFullPathTest, EveryListedExtensionInAnyCase) {
  const std::vector<std::pair<FileType, std::vector<std::string>>> classes = {
      {kFileTypeDocument,
       {"pdf",  "txt", "md",   "rtf", "csv", "tsv",  "html", "htm", "xml",  "json",
        "epub", "doc", "docx", "odt", "xls", "xlsx", "ods",  "ppt", "pptx", "odp"}},
      {kFileTypeAudio,
       {"mp3", "flac", "ogg", "oga", "opus", "wav", "m4a", "aac", "wma", "aiff", "ape"}},
      {kFileTypeVideo,
       {"mp4", "m4v", "mkv", "avi", "mov", "wmv", "webm", "mpg", "mpeg", "ts", "m2ts", "flv",
        "3gp"}},
      {kFileTypeImage,
       {"jpg", "jpeg", "png", "gif", "bmp", "tif", "tiff", "webp", "heic", "heif", "dng", "cr2",
        "cr3", "nef", "arw", "orf", "rw2"}},
  };
  for (const auto& [type, extensions] : classes) {
    for (const std::string& ext : extensions) {
      EXPECT_EQ(GetFileTypeByFullPath("/volume1/s/f." + ext), type) << ext;
      EXPECT_EQ(GetFileTypeByFullPath("/volume1/s/F." + Upper(ext)), type) << Upper(ext);
      EXPECT_EQ(GetFileTypeByExtension(ext), type) << ext;
    }
  }
}

TEST(GetFileTypeByFullPathTest, NamesAndMixedCase) {
  const std::vector<std::pair<std::string, FileType>> cases = {
      {"/a/IMG_0001.JpG", kFileTypeImage},
      {"/a/Song.FlAc", kFileTypeAudio},
      {"/a/clip.MkV", kFileTypeVideo},
      {"/a/report.final.PDF", kFileTypeDocument},
      {"/a/archive.tar.gz", kFileTypeOther},
      {"/a/movie.mp4.part", kFileTypeOther},
      {"/a/README", kFileTypeOther},
      {"/a/name.", kFileTypeOther},
      {"/a.pdf/readme", kFileTypeOther},  // the directory's dot does not count
      {"/a/.pdf", kFileTypeDocument},
      {"/a/x.jpgx", kFileTypeOther},
      {"/a/x.jp", kFileTypeOther},
      {"", kFileTypeOther},
      {"/a/", kFileTypeOther},
  };
  for (const auto& [path, expected] : cases) {
    EXPECT_EQ(GetFileTypeByFullPath(path), expected) << "[" << path << "]";
  }
  // The lookup itself does not fold case.
  EXPECT_EQ(GetFileTypeByExtension("JPG"), kFileTypeOther);
  EXPECT_EQ(GetFileTypeByExtension(""), kFileTypeOther);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex

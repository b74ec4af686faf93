#include "orvex/policy/file_type.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cctype>
#include <string>
#include <vector>

namespace orvex {
namespace fileindex {
namespace {

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
        "cr3", "nef", "arw", "orf", "rw2"}}};
  for (const auto& [type, extensions] : classes) {
    for (const std::string& ext : extensions) {
      EXPECT_EQ(GetFileTypeByFullPath("/volume1/s/f." + ext), type) << ext;
      std::string upper = ext;
      std::transform(upper.begin(), upper.end(), upper.begin(), ::toupper);
      EXPECT_EQ(GetFileTypeByFullPath("/volume1/s/F." + upper), type) << upper;
      EXPECT_EQ(GetFileTypeByExtension(ext), type) << ext;
    }
  }
}

TEST(GetFileTypeByFullPathTest, OnlyTheLastDotOfTheNameCounts) {
  EXPECT_EQ(GetFileTypeByFullPath("/a/IMG_0001.JpG"), kFileTypeImage);
  EXPECT_EQ(GetFileTypeByFullPath("/a/report.final.PDF"), kFileTypeDocument);
  EXPECT_EQ(GetFileTypeByFullPath("/a/.pdf"), kFileTypeDocument);
  for (const char* path : {"/a/archive.tar.gz", "/a/movie.mp4.part", "/a/README", "/a/name.",
                           "/a.pdf/readme", "/a/x.jpgx", "/a/x.jp", "", "/a/"}) {
    EXPECT_EQ(GetFileTypeByFullPath(path), kFileTypeOther) << "[" << path << "]";
  }
  // The lookup itself does not fold case.
  EXPECT_EQ(GetFileTypeByExtension("JPG"), kFileTypeOther);
  EXPECT_EQ(GetFileTypeByExtension(""), kFileTypeOther);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex

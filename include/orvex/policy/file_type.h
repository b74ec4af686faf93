// File classification by extension into the four classes a folder can select
// for indexing (document, audio, video, image). Pure functions over a
// constant table: safe for concurrent use.
#ifndef ORVEX_POLICY_FILE_TYPE_H_
#define ORVEX_POLICY_FILE_TYPE_H_

#include <string>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {

// The class of a file. The image class is the one a folder's "photo" flag
// selects.
enum FileType {
  kFileTypeOther,
  kFileTypeDocument,
  kFileTypeAudio,
  kFileTypeVideo,
  kFileTypeImage,
};

// The class of an extension already in lower case and without its dot
// ("jpg"); kFileTypeOther for an unknown or empty one. Never throws.
ORVEX_EXPORT FileType GetFileTypeByExtension(const std::string& lower_extension);

// The class of the file at full_path, from the extension of its base name in
// any letter case ("/a/IMG_1.JPG" is an image; "archive.tar.gz" counts by
// "gz"; a name without extension is kFileTypeOther). The file itself is not
// examined. Never throws.
ORVEX_EXPORT FileType GetFileTypeByFullPath(const std::string& full_path);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_POLICY_FILE_TYPE_H_

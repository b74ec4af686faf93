// The platform's content extraction: the document properties of one file or
// directory, named by the file index schema's KALOMD... properties. For now
// it gives the file-system attributes only, read with one statx call that
// does not follow a final symbolic link (a link is described as itself).
// Metadata (tags, dimensions, durations) and text content come later with the
// extraction service; until then "need_meta" true returns the same
// attributes. Thread-safe: no shared state.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_CONTENT_EXTRACT_H_
#define KALO_KALO_CONTENT_EXTRACT_H_

#include <json/json.h>

#include <string>

namespace KALO {
namespace CONTENT_EXTRACT {

// Replaces out with a JSON object describing the item at path (a full path):
//   "KALOMDPath"                 path as given
//   "KALOMDFSName"               the text after the last "/"
//   "KALOMDParent"               the text before the last "/" (no trailing "/")
//   "KALOMDExtension"            the text after the last "." of the name, in
//                                lower case; "" when the name has none
//   "KALOMDIsDir"                bool
//   "KALOMDFSSize"               size in bytes
//   "KALOMDPhysicalSize"         bytes allocated on disk (512-byte blocks)
//   "KALOMDFSContentChangeDate"  last content change (mtime), seconds since
//                                the epoch
//   "KALOMDAttributeChangeDate"  last attribute change (ctime)
//   "KALOMDFSCreationDate"       birth time; absent when the file system does
//                                not record one
//   "KALOMDOwnerUserID"          owner's uid, decimal, as a string
//   "KALOMDOwnerGroupID"         group's gid, decimal, as a string
//   "KALOMDPrivilege"            permission bits, four octal digits ("0644")
// cfg may hold "need_meta" (bool); see above. Returns true; false when the
// item cannot be examined (errno from statx, last error KLIB_ERR_IO) or path
// is empty (EINVAL, KLIB_ERR_BAD_PARAMETER), out then left as it was.
bool ParseFile(const std::string& path, const Json::Value& cfg, Json::Value& out);

}  // namespace CONTENT_EXTRACT
}  // namespace KALO

#endif  // KALO_KALO_CONTENT_EXTRACT_H_

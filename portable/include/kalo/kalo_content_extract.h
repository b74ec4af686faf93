// The platform's content extraction: the document properties of one file or
// directory, named by the file index schema's KALOMD... properties. The
// file-system attributes come from one statx call in the calling process that
// does not follow a final symbolic link (a link is described as itself).
// Metadata and text content of regular files are read by the parsers in
// another process, never this one: the extraction daemon when it runs,
// otherwise the one-shot program run as a child (see
// orvex/portable/extract_protocol.h and doc/content_extraction.md).
// Thread-safe: each thread keeps its own connection to the daemon between
// calls; what else the process keeps (the failure record last read) is
// under a lock.
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
// cfg may hold "need_meta" (bool): true adds, for a regular file, the
// metadata properties the parsers find (the attributes above win on a clash).
// FIFOs, devices and links are never opened. The extraction has a deadline
// and a memory cap, cfg's "deadline_ms" and "memory_mb" when given (positive
// integers; defaults 10000 and 512). A file whose extraction crashes, passes
// the deadline or the cap keeps its attributes (still true), is logged once
// and noted in /var/lib/orvex/extract_failures.json (under ORVEX_ROOT), and is
// not tried again until its size or change time differs. Returns true; false
// when the item cannot be examined (errno from statx, last error KLIB_ERR_IO)
// or path is empty (EINVAL, KLIB_ERR_BAD_PARAMETER), out then left as it was.
bool ParseFile(const std::string& path, const Json::Value& cfg, Json::Value& out);

}  // namespace CONTENT_EXTRACT
}  // namespace KALO

#endif  // KALO_KALO_CONTENT_EXTRACT_H_

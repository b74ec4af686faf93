// Folder: one indexed folder as the administrator configured it: its
// share-relative path, display name, which file types are indexed in it,
// whether its indexing is paused, and the volume whose index data is to be
// cleaned while a volume goes away. Records are shared through
// std::shared_ptr between the folder list and its callers. One thread at a
// time per record: the const accessors fill the cached share and full path.
#ifndef ORVEX_CONFIG_FOLDER_H_
#define ORVEX_CONFIG_FOLDER_H_

#include <json/json.h>

#include <string>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {

class FolderMgr;

class ORVEX_EXPORT Folder {
 public:
  // Sets the fields in this order; the volume to be cleaned, the share and
  // the full path start empty. Never throws.
  Folder(const std::string& path, const std::string& name, bool document, bool audio, bool video,
         bool photo, bool paused);

  // Reads a record as the folder configuration file stores it: "path" and
  // "name" (strings), "document", "audio", "video", "photo" (bools) are
  // required; "paused" (bool, default false) and "volume_to_be_clean"
  // (string, default "") are optional. Throws Error 120 as GetJsonValue does
  // when data is not an object or a required key is missing or mistyped.
  explicit Folder(const Json::Value& data);
  ~Folder();

  const std::string& GetPath() const { return path_; }
  const std::string& GetName() const { return name_; }
  const std::string& GetVolumeToBeClean() const { return volume_to_be_clean_; }
  bool IsDocument() const { return document_; }
  bool IsAudio() const { return audio_; }
  bool IsVideo() const { return video_; }
  bool IsPhoto() const { return photo_; }
  bool IsPaused() const { return paused_; }

  void SetPaused(bool paused) { paused_ = paused; }
  void SetVolumeToBeClean(const std::string& volume) { volume_to_be_clean_ = volume; }

  // The share component of the path, computed on first use and cached.
  // Throws Error 120 when the path has no share component.
  std::string GetShare() const;

  // Moves the folder to share `share`: the path's share component is
  // replaced and the new share cached. The cached full path is left as it
  // was: after a share rename callers build fresh records. Throws the share
  // path helpers' Error 120 (the path is malformed) or 800.
  void SetShare(const std::string& share);

  // The folder's absolute path on its volume, computed from the share
  // registry on first use and cached. Throws Error 120 for a malformed path
  // and 800 when the share is not registered.
  std::string GetFullPath() const;

  // The stored form: "path", "name", "document", "audio", "video", "photo",
  // "paused", "volume_to_be_clean" (in this order; never the cached values).
  Json::Value GetData() const;

  // The file-type selection alone: "document", "audio", "video", "photo".
  Json::Value GetIndexCfg() const;

  // True while events for this folder or anything below it wait in the
  // share's event queue (live or snapshot). Asked with the folder
  // configuration loaded: throws Error 504 when the folders file is
  // malformed, 800 for an unknown share, 502 when the queue cannot be read,
  // and the queue line errors (906, 120) for a malformed line.
  bool IsIndexing() const;

  // Sets out["text"] to "error" (with out["desc"] "invalid_path"),
  // "need_reindex", "finished", "paused" or "processing", the first that
  // applies in that order; other keys of out are left alone. Throws the
  // status file's Error 504 and the errors of IsIndexing.
  void GetStatus(Json::Value& out) const;

  // GetData() plus the sections named in `additional`, an array of words;
  // the only word is "status", written as {"additional": {"status": {...}}}.
  // An empty array adds nothing. Throws Error 120 when additional is not an
  // array, an element is not a string ("!it.isString()"), or a word is
  // unknown ("Unknown additioal: <word>"); and the errors of GetStatus.
  Json::Value GetDataWithAdditional(const Json::Value& additional) const;

 private:
  friend class FolderMgr;

  // The cached full path by reference, for the folder list's scans: they
  // test a thousand folders per file and must not copy a string for each.
  const std::string& CachedFullPath() const;

  std::string path_;
  std::string name_;
  std::string volume_to_be_clean_;
  bool document_ = false;
  bool audio_ = false;
  bool video_ = false;
  bool photo_ = false;
  bool paused_ = false;
  mutable std::string share_;
  mutable std::string full_path_;
};

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_CONFIG_FOLDER_H_

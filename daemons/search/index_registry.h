// IndexRegistry: which indexes exist (id, database path, paused), kept in one
// small JSON file that is replaced atomically on every change, so that the
// set survives a restart or a crash. One thread at a time.
#ifndef ORVEX_SEARCH_INDEX_REGISTRY_H_
#define ORVEX_SEARCH_INDEX_REGISTRY_H_

#include <map>
#include <string>

namespace orvex {
namespace search {

// The registry file under ORVEX_ROOT.
inline constexpr char kIndexRegistryPath[] = "/var/lib/orvex/kaloelasticd/indexes.json";

struct IndexRecord {
  std::string path;
  bool paused = false;
};

class IndexRegistry {
 public:
  // file is used as given (the caller resolves ORVEX_ROOT). Throws
  // SearchError kStorage when the file exists but cannot be read or parsed:
  // starting with an empty set would orphan every index.
  explicit IndexRegistry(const std::string& file);

  const std::map<std::string, IndexRecord>& indexes() const { return indexes_; }
  const IndexRecord* Find(const std::string& id) const;

  // Each change is written before it returns; throws kStorage (the
  // registry then unchanged, in memory and on disk) when it cannot be.
  void Put(const std::string& id, const IndexRecord& record);
  void Remove(const std::string& id);
  // Replaces id by new_id with record, in one write.
  void Rename(const std::string& id, const std::string& new_id, const IndexRecord& record);

 private:
  void Save(const std::map<std::string, IndexRecord>& next);

  std::string file_;
  std::map<std::string, IndexRecord> indexes_;
};

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_INDEX_REGISTRY_H_

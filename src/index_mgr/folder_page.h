// FolderPage: one page of the folder list as the web API shows it, each
// folder with the sections it asks for. It gives exactly what
// Folder::GetDataWithAdditional gives for each folder, but shares the work
// that those calls would each redo: the status file is loaded once, each
// folder's indexability is decided once, and each share's event queue is
// read at most once for all the page's folders of that share (a thousand
// folders would otherwise reread the folder list and rescan their share's
// whole queue one by one). One thread at a time.
#ifndef ORVEX_SRC_INDEX_MGR_FOLDER_PAGE_H_
#define ORVEX_SRC_INDEX_MGR_FOLDER_PAGE_H_

#include <json/json.h>

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "orvex/config/folder_mgr.h"
#include "orvex/status/status_mgr.h"

namespace orvex {
namespace fileindex {

class PendingScan;

class FolderPage {
 public:
  // folders must outlive the page.
  explicit FolderPage(const std::vector<FolderMgr::FolderPtr>& folders);
  FolderPage(const FolderPage&) = delete;
  FolderPage& operator=(const FolderPage&) = delete;
  ~FolderPage();

  // folders[i]->GetDataWithAdditional(additional), with the same errors
  // thrown at the same point; call it in page order.
  Json::Value GetDataWithAdditional(size_t i, const Json::Value& additional);

 private:
  // Per share: its scan and which of its folders are the scan's targets.
  struct ShareScan {
    std::unique_ptr<PendingScan> scan;
    std::map<size_t, size_t> target_of;  // page index -> target index
  };

  void GetStatus(size_t i, Json::Value& out);
  const StatusMgr& Status();
  bool Indexable(size_t i);
  bool IsIndexing(size_t i);
  ShareScan& ScanFor(const std::string& share);

  const std::vector<FolderMgr::FolderPtr>& folders_;
  std::unique_ptr<StatusMgr> status_;
  std::vector<std::optional<bool>> indexable_;
  std::map<std::string, ShareScan> scans_;
};

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_INDEX_MGR_FOLDER_PAGE_H_

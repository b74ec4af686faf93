// LogCapture: collects the library's log lines for a scope instead of
// sending them to the system log.
#ifndef ORVEX_TESTS_SUPPORT_LOG_CAPTURE_H_
#define ORVEX_TESTS_SUPPORT_LOG_CAPTURE_H_

#include <string>
#include <vector>

#include "orvex/foundation/log.h"

namespace orvex {
namespace testing {

class LogCapture {
 public:
  LogCapture() {
    previous_ = SetLogSink([this](int, const std::string& line) { lines_.push_back(line); });
  }
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;
  ~LogCapture() { SetLogSink(std::move(previous_)); }

  const std::vector<std::string>& lines() const { return lines_; }
  // Lines containing text.
  std::vector<std::string> Matching(const std::string& text) const {
    std::vector<std::string> found;
    for (const auto& line : lines_) {
      if (line.find(text) != std::string::npos) found.push_back(line);
    }
    return found;
  }

 private:
  LogSink previous_;
  std::vector<std::string> lines_;
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_SUPPORT_LOG_CAPTURE_H_

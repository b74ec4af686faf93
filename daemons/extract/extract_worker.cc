// The worker side of content extraction: what runs in the isolated process,
// for the daemon's pool (extract_service.cc) and for the one-shot mode.
#include "extract_worker.h"

#include <signal.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <sys/uio.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <exception>
#include <fstream>
#include <memory>
#include <new>
#include <sstream>
#include <string>
#include <utility>

#include "compact_json.h"
#include "extract_service.h"

namespace orvex {
namespace portable {
namespace {

using orvex::portable::CompactJsonText;
using orvex::portable::ParseCompactJson;

// "VmData:" of /proc/self/status, in bytes: what RLIMIT_DATA counts. Under
// the address sanitizer this already includes its shadow memory, so the cap
// is set above the current figure rather than as an absolute size.
bool CurrentDataBytes(rlim_t& bytes) {
  std::ifstream status("/proc/self/status");
  std::string line;
  while (std::getline(status, line)) {
    unsigned long long kb = 0;
    if (std::sscanf(line.c_str(), "VmData: %llu kB", &kb) == 1) {
      bytes = static_cast<rlim_t>(kb) * 1024;
      return true;
    }
  }
  errno = ENOENT;
  return false;
}

// Past the cap, operator new cannot get memory: end the worker with a status
// its parent recognises. Nothing is freed or logged: there is no memory.
void OnOutOfMemory() { ::_exit(kExtractExitMemoryCap); }

}  // namespace

AnswerParts SplitAnswer(Json::Value answer) {
  AnswerParts parts;
  // Looked at through a const view, which adds no member that is absent.
  const Json::Value& view = answer;
  if (view.isObject() && view["data"].isObject() && view["data"][kExtractTextMember].isString()) {
    answer["data"].removeMember(kExtractTextMember, &parts.text);
    const char* begin = nullptr;
    const char* end = nullptr;
    parts.text.getString(&begin, &end);
    answer["text_bytes"] = static_cast<Json::UInt64>(end - begin);
  }
  parts.json = CompactJsonText(answer);
  return parts;
}

std::string AnswerMessage(Json::Value answer) {
  const AnswerParts parts = SplitAnswer(std::move(answer));
  if (!parts.text.isString()) return parts.json;
  const char* begin = nullptr;
  const char* end = nullptr;
  parts.text.getString(&begin, &end);
  std::string message;
  message.reserve(parts.json.size() + 1 + static_cast<size_t>(end - begin));
  message += parts.json;
  message += '\0';
  message.append(begin, end);
  return message;
}

bool WorkerChannel::SendAnswer(Json::Value answer) {
  const AnswerParts parts = SplitAnswer(std::move(answer));
  const char* text = nullptr;
  const char* text_end = nullptr;
  if (parts.text.isString()) parts.text.getString(&text, &text_end);
  const size_t text_size = static_cast<size_t>(text_end - text);
  const size_t length = parts.json.size() + 1 + (parts.text.isString() ? text_size + 1 : 0);
  if (length > kalodaemon::kMaxMessageBytes) {
    errno = EMSGSIZE;
    return false;
  }
  const uint32_t length_word = static_cast<uint32_t>(length);
  static const char kNul[1] = {'\0'};
  // Written from where each part lies: the text, the bulk of an answer,
  // is never copied into a frame of its own.
  struct iovec parts_out[5] = {
      {const_cast<uint32_t*>(&length_word), sizeof(length_word)},
      {const_cast<char*>(parts.json.data()), parts.json.size()},
      {const_cast<char*>(kNul), 1},
      {const_cast<char*>(text), text_size},
      {const_cast<char*>(kNul), parts.text.isString() ? 1u : 0u},
  };
  struct iovec* next = parts_out;
  size_t left = 5;
  while (left > 0) {
    struct msghdr message = {};
    message.msg_iov = next;
    message.msg_iovlen = left;
    // As Send: a daemon gone is an error here, never a SIGPIPE.
    const ssize_t n = ::sendmsg(fd_.get(), &message, MSG_NOSIGNAL);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    size_t done = static_cast<size_t>(n);
    while (left > 0 && done >= next->iov_len) {
      done -= next->iov_len;
      ++next;
      --left;
    }
    if (left > 0) {
      next->iov_base = static_cast<char*>(next->iov_base) + done;
      next->iov_len -= done;
    }
  }
  return true;
}

bool CapWorkerMemory(int memory_mb) {
  const struct rlimit no_core = {0, 0};
  ::setrlimit(RLIMIT_CORE, &no_core);  // a crashing parser must not fill the disk
  std::set_new_handler(OnOutOfMemory);
  rlim_t used = 0;
  if (!CurrentDataBytes(used)) return false;
  const rlim_t cap = used + static_cast<rlim_t>(memory_mb) * 1024 * 1024;
  const struct rlimit limit = {cap, cap};
  return ::setrlimit(RLIMIT_DATA, &limit) == 0;
}

Json::Value ExtractInWorker(const std::string& path, const Extractor& extractor) {
  Json::Value answer(Json::objectValue);
  // lstat, not open: opening a FIFO blocks and opening a device may act on it.
  struct stat st;
  if (::lstat(path.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) {
    answer["ok"] = false;
    answer["not_regular"] = true;
    answer["reason"] = "not a regular file";
    return answer;
  }
  Json::Value data(Json::objectValue);
  std::string problem;
  bool ok = false;
  try {
    ok = extractor(path, data, &problem);
  } catch (const std::exception& e) {
    problem = std::string("parser failed: ") + e.what();
  }
  if (!data.isObject()) data = Json::Value(Json::objectValue);
  answer["ok"] = ok;
  answer["data"] = std::move(data);  // it may hold a long text
  if (!ok) answer["reason"] = problem.empty() ? std::string("parser failed") : problem;
  return answer;
}

int RunOneShot(const std::string& path, int deadline_ms, int memory_mb, const Extractor& extractor,
               std::string& out, std::string& err) {
  if (!CapWorkerMemory(memory_mb)) {
    err = std::string("cannot cap memory: ") + std::strerror(errno);
    return kExtractExitUsage;
  }
  // The caller kills us at the deadline; this only covers a caller that died.
  ::signal(SIGALRM, SIG_DFL);
  struct itimerval backstop = {};
  backstop.it_value.tv_sec = deadline_ms / 1000 + 1;
  backstop.it_value.tv_usec = (deadline_ms % 1000) * 1000;
  ::setitimer(ITIMER_REAL, &backstop, nullptr);
  const Json::Value answer = ExtractInWorker(path, extractor);
  if (answer["not_regular"].asBool()) {
    err = answer["reason"].asString();
    return kExtractExitNotRegular;
  }
  out = CompactJsonText(answer["data"]) + "\n";
  if (!answer["ok"].asBool()) {
    err = answer["reason"].asString();
    return kExtractExitProblem;
  }
  return kExtractExitOk;
}

void ServeWorker(FileDescriptor channel, int memory_mb, const Extractor& extractor) {
  WorkerChannel link(std::move(channel));
  if (!CapWorkerMemory(memory_mb)) ::_exit(kExtractExitUsage);
  // Ready: the daemon starts a file's deadline only from here, so the time a
  // new worker takes to start is never charged to a file.
  if (!link.Send("{\"ready\": true}")) ::_exit(0);
  std::string request;
  while (link.Recv(request)) {
    Json::Value parsed;
    Json::Value answer;
    if (!ParseCompactJson(request, parsed) || !parsed["path"].isString()) {
      answer["ok"] = false;
      answer["reason"] = "bad request to worker";
    } else {
      answer = ExtractInWorker(parsed["path"].asString(), extractor);
    }
    if (!link.SendAnswer(std::move(answer))) break;
  }
  ::_exit(0);  // the daemon closed our channel: it is done with us
}

}  // namespace portable
}  // namespace orvex

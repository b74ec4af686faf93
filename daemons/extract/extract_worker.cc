// The worker side of content extraction: what runs in the isolated process,
// for the daemon's pool (extract_service.cc) and for the one-shot mode.
#include "extract_worker.h"

#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <exception>
#include <fstream>
#include <new>
#include <sstream>
#include <string>
#include <utility>

#include "extract_service.h"

namespace orvex {
namespace portable {
namespace {

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

std::string JsonText(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  return Json::writeString(builder, value);
}

}  // namespace

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
  answer["data"] = data;
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
  out = JsonText(answer["data"]) + "\n";
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
    Json::CharReaderBuilder builder;
    std::string errors;
    std::istringstream in(request);
    Json::Value answer;
    if (!Json::parseFromStream(builder, in, &parsed, &errors) || !parsed["path"].isString()) {
      answer["ok"] = false;
      answer["reason"] = "bad request to worker";
    } else {
      answer = ExtractInWorker(parsed["path"].asString(), extractor);
    }
    if (!link.Send(JsonText(answer))) break;
  }
  ::_exit(0);  // the daemon closed our channel: it is done with us
}

}  // namespace portable
}  // namespace orvex

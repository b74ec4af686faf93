// The extraction daemon's loop. Every descriptor is non-blocking and every
// wait ends at the next deadline, so one client that stalls, floods or lies
// about lengths costs at most its own connection, and one file that crashes,
// hangs or eats memory costs at most its own worker.
#include "extract_service.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <memory>
#include <sstream>
#include <string>
#include <utility>

#include "compact_json.h"
#include "extract_worker.h"
#include "kalo_log.h"

namespace orvex {
namespace portable {
namespace {

using orvex::portable::CompactJsonText;
using orvex::portable::ParseCompactJson;

constexpr size_t kReadChunk = 64 * 1024;
constexpr int kAcceptsPerRound = 16;
constexpr int kReadsPerRound = 64;
// Room for a long text in the sockets that carry answers (the worker's end
// of its channel, the daemon's end of each client's connection), so that
// most answers cross in one write rather than a buffer's worth per wake-up.
// The kernel charges it only while bytes are in flight.
constexpr int kAnswerSocketBuffer = 1 << 20;
constexpr size_t kRecycledBufferBytes = 4u << 20;
// A worker's answer carries at most the parsers' text limit and the
// properties: far below this. More means the worker is not ours any more.
constexpr uint32_t kMaxAnswerBytes = 64u << 20;

// True when what follows a worker's JSON header (from header_end to end) is
// what the header announces: the NUL and "text_bytes" bytes of text, or
// nothing.
bool TextFits(const Json::Value& header, const char* header_end, const char* end) {
  if (!header.isMember("text_bytes")) return header_end == end;
  const Json::Value& bytes = header["text_bytes"];
  return bytes.isUInt64() && header_end < end &&
         static_cast<Json::UInt64>(end - header_end - 1) == bytes.asUInt64();
}

Json::Value Failure(const std::string& reason, const char* fault = nullptr) {
  Json::Value answer(Json::objectValue);
  answer["ok"] = false;
  answer["reason"] = reason;
  if (fault != nullptr) answer["fault"] = fault;
  return answer;
}

// What a worker's end says about the file it was given.
Json::Value FaultOf(int status, int memory_mb) {
  if (WIFEXITED(status) && WEXITSTATUS(status) == kExtractExitMemoryCap) {
    return Failure("exceeded the memory cap of " + std::to_string(memory_mb) + " MiB", "memory");
  }
  if (WIFSIGNALED(status)) {
    return Failure(std::string("the parser crashed (") + strsignal(WTERMSIG(status)) + ")",
                   "crash");
  }
  return Failure("the parser's worker ended with status " +
                     std::to_string(WIFEXITED(status) ? WEXITSTATUS(status) : -1),
                 "crash");
}

// Rounded up: a wait that ended a fraction of a millisecond early would find
// the deadline not yet passed and wait for 0 ms again and again until it is.
int MillisUntil(std::chrono::steady_clock::time_point when) {
  const auto left =
      std::chrono::ceil<std::chrono::milliseconds>(when - std::chrono::steady_clock::now()).count();
  return static_cast<int>(std::max<long long>(0, std::min<long long>(left, INT_MAX)));
}

bool MakeDirs(const std::string& dir) {
  for (size_t slash = dir.find('/', 1);; slash = dir.find('/', slash + 1)) {
    const std::string prefix = dir.substr(0, slash);
    if (!prefix.empty() && ::mkdir(prefix.c_str(), 0755) != 0 && errno != EEXIST) return false;
    if (slash == std::string::npos) return true;
  }
}

bool SocketAddress(const std::string& path, struct sockaddr_un& address) {
  std::memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  if (path.empty() || path.size() >= sizeof(address.sun_path)) {
    errno = path.empty() ? ENOENT : ENAMETOOLONG;
    return false;
  }
  std::memcpy(address.sun_path, path.data(), path.size());
  return true;
}

// True when a daemon answers a connection on path.
bool SomeoneListens(const struct sockaddr_un& address) {
  const FileDescriptor probe(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  return probe && ::connect(probe.get(), reinterpret_cast<const struct sockaddr*>(&address),
                            sizeof(address)) == 0;
}

// Runs in the new worker right after fork: it keeps only its channel (as
// descriptor 3) and the standard ones, so that it holds no client's
// connection open and cannot reach the listening socket, and it dies with
// the daemon.
[[noreturn]] void BecomeWorker(int channel, int memory_mb, const Extractor& extractor) {
  if (channel != 3 && ::dup2(channel, 3) < 0) ::_exit(kExtractExitUsage);
  ::close_range(4, ~0U, 0);
  sigset_t none;
  sigemptyset(&none);
  ::sigprocmask(SIG_SETMASK, &none, nullptr);
  ::signal(SIGTERM, SIG_DFL);
  ::signal(SIGINT, SIG_DFL);
  ::prctl(PR_SET_PDEATHSIG, SIGKILL);
  if (::getppid() == 1) ::_exit(0);  // the daemon died before the line above
  ServeWorker(FileDescriptor(3), memory_mb, extractor);
}

// True when buffer holds a whole message.
bool HasWholeFrame(const std::string& buffer) {
  uint32_t length = 0;
  if (buffer.size() < sizeof(length)) return false;
  std::memcpy(&length, buffer.data(), sizeof(length));
  return buffer.size() - sizeof(length) >= length;
}

}  // namespace

std::string Frame(const std::string& text) {
  const uint32_t length = static_cast<uint32_t>(text.size() + 1);
  std::string frame(sizeof(length), '\0');
  std::memcpy(&frame[0], &length, sizeof(length));
  frame += text;
  frame += '\0';
  return frame;
}

bool TakeFrame(std::string& buffer, uint32_t max_bytes, std::string& body, bool* too_large) {
  *too_large = false;
  uint32_t length = 0;
  if (buffer.size() < sizeof(length)) return false;
  std::memcpy(&length, buffer.data(), sizeof(length));
  if (length > max_bytes) {
    *too_large = true;
    return false;
  }
  if (buffer.size() - sizeof(length) < length) return false;
  body.assign(buffer, sizeof(length), length);
  buffer.erase(0, sizeof(length) + length);
  if (!body.empty() && body.back() == '\0') body.pop_back();
  return true;
}

ExtractService::ExtractService(ExtractServiceOptions options, Extractor extractor)
    : options_(std::move(options)), extractor_(std::move(extractor)) {
  options_.workers = std::max(1, options_.workers);
  options_.deadline_ms = std::max(1, options_.deadline_ms);
  options_.max_connections = std::max<size_t>(1, options_.max_connections);
}

ExtractService::~ExtractService() { Stop(); }

bool ExtractService::Start() {
  struct sockaddr_un address;
  if (!SocketAddress(options_.socket_path, address)) return false;
  const size_t slash = options_.socket_path.rfind('/');
  if (slash != std::string::npos && slash > 0 && !MakeDirs(options_.socket_path.substr(0, slash))) {
    return false;
  }
  if (SomeoneListens(address)) {
    errno = EADDRINUSE;
    return false;
  }
  ::unlink(options_.socket_path.c_str());  // stale: its daemon is gone
  FileDescriptor fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!fd) return false;
  // The socket file takes its mode from the umask at bind; no moment with
  // wider access than 0660, whatever the inherited umask.
  const mode_t old_umask = ::umask(0117);
  const int bound =
      ::bind(fd.get(), reinterpret_cast<const struct sockaddr*>(&address), sizeof(address));
  ::umask(old_umask);
  if (bound != 0 || ::chmod(options_.socket_path.c_str(), 0660) != 0 ||
      ::listen(fd.get(), 64) != 0) {
    return false;
  }
  listener_ = std::move(fd);
  EnsureWorkers();
  return true;
}

void ExtractService::Stop() {
  for (Worker& worker : workers_) {
    ::kill(worker.pid, SIGKILL);
    int status;
    while (::waitpid(worker.pid, &status, 0) < 0 && errno == EINTR) {
    }
  }
  workers_.clear();
  clients_.clear();
  queue_.clear();
  if (listener_) {
    listener_.reset();
    ::unlink(options_.socket_path.c_str());
  }
}

bool ExtractService::SpawnWorker() {
  int ends[2];
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return false;
  FileDescriptor ours(ends[0]);
  FileDescriptor theirs(ends[1]);
  ::setsockopt(theirs.get(), SOL_SOCKET, SO_SNDBUF, &kAnswerSocketBuffer,
               sizeof(kAnswerSocketBuffer));  // best effort: the default also works
  const pid_t pid = ::fork();
  if (pid < 0) return false;
  if (pid == 0) BecomeWorker(theirs.get(), options_.memory_mb, extractor_);
  ::fcntl(ours.get(), F_SETFL, O_NONBLOCK);
  Worker worker;
  worker.pid = pid;
  worker.channel = std::move(ours);
  workers_.push_back(std::move(worker));
  ++workers_started_;
  return true;
}

void ExtractService::EnsureWorkers() {
  if (Clock::now() < next_spawn_) return;
  while (workers_.size() < static_cast<size_t>(options_.workers)) {
    if (!SpawnWorker()) {
      KALO_LOG(LOG_ERR, "cannot start an extraction worker: %s", std::strerror(errno));
      return;  // tried again next round
    }
  }
}

int ExtractService::WaitBudget(int max_wait_ms) const {
  for (const auto& entry : clients_) {
    const Client& client = entry.second;
    // A whole request already in hand (sent behind another) is not waited for.
    if (IsIdle(client) && HasWholeFrame(client.in)) return 0;
  }
  int budget = std::max(0, max_wait_ms);
  if (workers_.size() < static_cast<size_t>(options_.workers)) {
    budget = std::min(budget, MillisUntil(next_spawn_));
  }
  for (const Worker& worker : workers_) {
    if (worker.busy) budget = std::min(budget, MillisUntil(worker.deadline));
  }
  for (const Pending& pending : queue_) budget = std::min(budget, MillisUntil(pending.expires));
  for (const auto& entry : clients_) {
    if (entry.second.waiting) continue;  // its deadline is the request's
    budget = std::min(budget, MillisUntil(entry.second.last_activity +
                                          std::chrono::milliseconds(options_.idle_ms)));
  }
  return budget;
}

bool ExtractService::RunOnce(int max_wait_ms) {
  EnsureWorkers();
  TakeAllRequests();  // those that arrived behind an answered one
  Dispatch();
  std::vector<struct pollfd> fds;
  std::vector<uint64_t> client_ids;
  fds.push_back({listener_.get(), POLLIN, 0});
  fds.push_back({wake_fd_, POLLIN, 0});
  for (const auto& entry : clients_) {
    const Client& client = entry.second;
    short events = 0;
    // Only a client with nothing in hand is read: its buffer then holds at
    // most one unfinished request and one read more.
    if (!client.waiting && !client.close_after_write && client.out.empty()) events |= POLLIN;
    if (!client.out.empty()) events |= POLLOUT;
    fds.push_back({client.fd.get(), events, 0});
    client_ids.push_back(entry.first);
  }
  std::vector<pid_t> worker_pids;
  for (const Worker& worker : workers_) {
    fds.push_back({worker.channel.get(), POLLIN, 0});
    worker_pids.push_back(worker.pid);
  }
  const int ready = ::poll(fds.data(), fds.size(), WaitBudget(max_wait_ms));
  if (ready < 0) return false;  // EINTR: the caller looks at its flags
  const bool woken = fds[1].revents != 0;
  if (fds[0].revents != 0) AcceptClients();
  for (size_t i = 0; i < client_ids.size(); ++i) {
    const short revents = fds[2 + i].revents;
    if (revents & POLLOUT) WriteClient(client_ids[i]);
    if (revents & (POLLIN | POLLHUP | POLLERR)) ReadClient(client_ids[i]);
  }
  for (size_t i = 0; i < worker_pids.size(); ++i) {
    if (fds[2 + client_ids.size() + i].revents == 0) continue;
    for (size_t w = 0; w < workers_.size(); ++w) {
      if (workers_[w].pid == worker_pids[i]) {
        ReadWorker(w);
        break;
      }
    }
  }
  TakeAllRequests();
  ExpireDeadlines();
  EnsureWorkers();
  Dispatch();
  return woken;
}

void ExtractService::AcceptClients() {
  for (int i = 0; i < kAcceptsPerRound; ++i) {
    FileDescriptor fd(::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (!fd) return;
    if (clients_.size() >= options_.max_connections) {
      KALO_LOG(LOG_WARNING, "refused a client: %zu connections already", options_.max_connections);
      continue;  // closed as fd goes
    }
    ::setsockopt(fd.get(), SOL_SOCKET, SO_SNDBUF, &kAnswerSocketBuffer,
                 sizeof(kAnswerSocketBuffer));  // best effort: the default also works
    Client client;
    client.fd = std::move(fd);
    client.last_activity = Clock::now();
    clients_.emplace(next_client_++, std::move(client));
  }
}

void ExtractService::ReadClient(uint64_t id) {
  auto it = clients_.find(id);
  if (it == clients_.end()) return;
  Client& client = it->second;
  char chunk[kReadChunk];
  const ssize_t n = ::recv(client.fd.get(), chunk, sizeof(chunk), 0);
  if (n < 0 && (errno == EAGAIN || errno == EINTR)) return;
  if (n <= 0) {
    CloseClient(id);  // gone; an answer still to come is dropped
    return;
  }
  client.in.append(chunk, static_cast<size_t>(n));
  client.last_activity = Clock::now();
}

// One request per idle client per round, taken after the reads: a client
// that sends many at once is served in turn with the others, and what it
// has sent beyond one request waits unread in its socket.
void ExtractService::TakeAllRequests() {
  std::vector<uint64_t> idle;
  for (const auto& entry : clients_) {
    const Client& client = entry.second;
    if (IsIdle(client) && !client.in.empty()) {
      idle.push_back(entry.first);
    }
  }
  for (const uint64_t id : idle) TakeRequests(id);
}

void ExtractService::TakeRequests(uint64_t id) {
  Client& client = clients_.at(id);
  std::string body;
  bool too_large = false;
  // One request at a time per client: the next waits in client.in until
  // the answer to this one has been written.
  if (TakeFrame(client.in, options_.max_request_bytes, body, &too_large)) {
    HandleRequest(id, body);
  } else if (too_large) {
    client.in.clear();
    Answer(id,
           Failure("request longer than " + std::to_string(options_.max_request_bytes) + " bytes"),
           /*close_after=*/true);
  }
}

void ExtractService::HandleRequest(uint64_t id, const std::string& body) {
  Json::Value request;
  if (!ParseCompactJson(body, request) || !request.isObject() || !request["path"].isString() ||
      request["path"].asString().empty()) {
    Answer(id, Failure("bad request: expected {\"path\": FULL_PATH}"), /*close_after=*/false);
    return;
  }
  if (queue_.size() >= options_.max_queue) {
    Json::Value busy = Failure("busy: too many requests waiting");
    busy["busy"] = true;
    Answer(id, busy, /*close_after=*/false);
    return;
  }
  Pending pending;
  pending.client = id;
  pending.path = request["path"].asString();
  pending.deadline_ms = options_.deadline_ms;
  const Json::Value& asked = request["deadline_ms"];
  if (asked.isIntegral() && asked.asInt64() > 0 && asked.asInt64() < options_.deadline_ms) {
    pending.deadline_ms = asked.asInt();
  }
  // A request waits for a worker at most as long as it may take in one.
  pending.expires = Clock::now() + std::chrono::milliseconds(pending.deadline_ms);
  queue_.push_back(std::move(pending));
  clients_.at(id).waiting = true;
}

void ExtractService::Answer(uint64_t id, const Json::Value& answer, bool close_after) {
  AnswerFrame(id, Frame(CompactJsonText(answer)), close_after);
}

void ExtractService::AnswerFrame(uint64_t id, std::string frame, bool close_after) {
  auto it = clients_.find(id);
  if (it == clients_.end()) return;
  Client& client = it->second;
  client.waiting = false;
  client.close_after_write = close_after;
  client.out.swap(frame);
  client.out_done = 0;
  client.last_activity = Clock::now();
  WriteClient(id);
}

void ExtractService::WriteClient(uint64_t id) {
  auto it = clients_.find(id);
  if (it == clients_.end()) return;
  Client& client = it->second;
  while (client.out_done < client.out.size()) {
    const ssize_t n = ::send(client.fd.get(), client.out.data() + client.out_done,
                             client.out.size() - client.out_done, MSG_NOSIGNAL);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && errno == EAGAIN) return;
    if (n <= 0) {
      CloseClient(id);
      return;
    }
    client.out_done += static_cast<size_t>(n);
    client.last_activity = Clock::now();
  }
  client.out.clear();
  client.out_done = 0;
  if (client.close_after_write) CloseClient(id);
}

void ExtractService::ReadWorker(size_t index) {
  Worker& worker = workers_[index];
  // What is there is read at once: an answer with a long text fills the
  // channel's buffer several times over. Bounded, so that a worker gone
  // wrong that never stops writing cannot hold the loop.
  for (int reads = 0; reads < kReadsPerRound; ++reads) {
    char chunk[kReadChunk];
    const ssize_t n = ::recv(worker.channel.get(), chunk, sizeof(chunk), 0);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && errno == EAGAIN) break;
    if (n <= 0) {
      EndWorker(index, nullptr);  // it died: its status tells why
      return;
    }
    worker.in.append(chunk, static_cast<size_t>(n));
    if (static_cast<size_t>(n) < sizeof(chunk)) break;
  }
  uint32_t length = 0;
  if (worker.in.size() < sizeof(length)) return;
  std::memcpy(&length, worker.in.data(), sizeof(length));
  if (length > kMaxAnswerBytes) {
    const Json::Value broken = Failure("the parser's worker sent a broken answer", "crash");
    EndWorker(index, &broken);
    return;
  }
  const size_t frame_size = sizeof(length) + length;
  if (worker.in.size() < frame_size) {
    worker.in.reserve(frame_size);  // the rest comes without copying what is in
    return;
  }
  std::string frame;
  if (worker.in.size() == frame_size) {
    frame.swap(worker.in);
  } else {
    frame.assign(worker.in, 0, frame_size);
    worker.in.erase(0, frame_size);
  }
  // The answer goes to the client as the worker framed it: only its JSON
  // header is read here, never the text behind it.
  const char* body = frame.data() + sizeof(length);
  const char* end = body + length;
  if (end > body && end[-1] == '\0') --end;
  const char* header_end = static_cast<const char*>(std::memchr(body, '\0', end - body));
  if (header_end == nullptr) header_end = end;
  Json::Value header;
  const bool parsed = ParseCompactJson(body, header_end, header) && header.isObject();
  if (!worker.ready && !worker.busy && parsed && header["ready"].asBool()) {
    worker.ready = true;
    return;
  }
  if (!worker.busy || !parsed || !TextFits(header, header_end, end)) {
    const Json::Value broken = Failure("the parser's worker sent a broken answer", "crash");
    EndWorker(index, &broken);
    return;
  }
  worker.busy = false;
  worker.in.clear();
  const uint64_t client = worker.client;
  AnswerFrame(client, std::move(frame), /*close_after=*/false);
  // The client's last answer buffer, written by now, takes the next answer:
  // a long one then lands in memory already mapped.
  auto it = clients_.find(client);
  if (it != clients_.end() && it->second.out.empty() && worker.in.empty() &&
      it->second.out.capacity() <= kRecycledBufferBytes) {
    worker.in.swap(it->second.out);
  }
}

void ExtractService::EndWorker(size_t index, const Json::Value* fault_answer) {
  Worker worker = std::move(workers_[index]);
  workers_.erase(workers_.begin() + static_cast<std::ptrdiff_t>(index));
  ::kill(worker.pid, SIGKILL);
  int status = 0;
  while (::waitpid(worker.pid, &status, 0) < 0 && errno == EINTR) {
  }
  if (!worker.busy) {
    KALO_LOG(LOG_WARNING, "an idle extraction worker ended (status 0x%x); replacing it", status);
    // One that died before it was ready would die again at once: no loop of
    // forks, one more try a second later.
    if (!worker.ready) next_spawn_ = Clock::now() + std::chrono::seconds(1);
    return;
  }
  const Json::Value answer = fault_answer ? *fault_answer : FaultOf(status, options_.memory_mb);
  KALO_LOG(LOG_WARNING, "extraction worker %d replaced: %s", static_cast<int>(worker.pid),
           answer["reason"].asString().c_str());
  Answer(worker.client, answer, /*close_after=*/false);
}

void ExtractService::ExpireDeadlines() {
  const Clock::time_point now = Clock::now();
  for (size_t i = 0; i < workers_.size();) {
    if (workers_[i].busy && workers_[i].deadline <= now) {
      const Json::Value late = Failure(
          "took longer than the deadline of " + std::to_string(workers_[i].deadline_ms) + " ms",
          "timeout");
      EndWorker(i, &late);  // killed: a parser that loops never comes back
    } else {
      ++i;
    }
  }
  while (!queue_.empty() && queue_.front().expires <= now) {
    const uint64_t id = queue_.front().client;
    queue_.pop_front();
    Json::Value busy = Failure("busy: no worker was free before the deadline");
    busy["busy"] = true;
    Answer(id, busy, /*close_after=*/false);
  }
  std::vector<uint64_t> idle;
  for (const auto& entry : clients_) {
    const Client& client = entry.second;
    // Connected but silent, stalled mid-message, or not reading its answer:
    // each holds one of the few connections, so none may do it for ever.
    if (!client.waiting &&
        now - client.last_activity >= std::chrono::milliseconds(options_.idle_ms)) {
      idle.push_back(entry.first);
    }
  }
  for (const uint64_t id : idle) CloseClient(id);
}

void ExtractService::Dispatch() {
  for (Worker& worker : workers_) {
    if (worker.busy || !worker.ready) continue;
    while (!queue_.empty() && clients_.count(queue_.front().client) == 0) queue_.pop_front();
    if (queue_.empty()) return;
    Pending pending = std::move(queue_.front());
    queue_.pop_front();
    Json::Value request(Json::objectValue);
    request["path"] = pending.path;
    const std::string frame = Frame(CompactJsonText(request));
    // A request is far smaller than an empty socket buffer: it goes whole.
    const ssize_t n = ::send(worker.channel.get(), frame.data(), frame.size(), MSG_NOSIGNAL);
    worker.busy = true;
    worker.client = pending.client;
    worker.deadline_ms = pending.deadline_ms;
    worker.deadline = Clock::now() + std::chrono::milliseconds(pending.deadline_ms);
    if (n != static_cast<ssize_t>(frame.size())) {
      worker.deadline = Clock::now();  // the next round ends it and answers
    }
  }
}

void ExtractService::CloseClient(uint64_t id) { clients_.erase(id); }

}  // namespace portable
}  // namespace orvex

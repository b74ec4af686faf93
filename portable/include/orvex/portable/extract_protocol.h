// What the content-extraction service and its callers agree on: where the
// daemon's socket, pid file and program live, the failure record, the
// property carried outside the answers' JSON text, the default limits, and
// the exit statuses of the program's one-shot mode. doc/content_extraction.md
// describes the socket's messages. Constants only.
#ifndef ORVEX_PORTABLE_EXTRACT_PROTOCOL_H_
#define ORVEX_PORTABLE_EXTRACT_PROTOCOL_H_

namespace orvex {
namespace portable {

// Fixed paths, resolved under ORVEX_ROOT where they are opened.
constexpr char kExtractSocketPath[] = "/var/run/kalocontentextractd.sock";
constexpr char kExtractPidPath[] = "/var/run/kalocontentextractd.pid";
constexpr char kExtractProgramPath[] = "/usr/kalo/bin/kalocontentextractd";
constexpr char kExtractFailuresPath[] = "/var/lib/orvex/extract_failures.json";

// The property that carries a file's text. In an answer on the socket it
// travels outside the JSON text, as raw bytes after its NUL, announced by
// the answer's "text_bytes" (see doc/content_extraction.md).
constexpr char kExtractTextMember[] = "KALOMDTextContent";

constexpr int kDefaultExtractDeadlineMs = 10000;
constexpr int kDefaultExtractMemoryMb = 512;

// Exit statuses of the one-shot mode. None is 1, which the sanitizers and
// many runtime aborts use: any status not listed here is a crash.
constexpr int kExtractExitOk = 0;
constexpr int kExtractExitUsage = 2;
constexpr int kExtractExitProblem = 10;     // the parser found the file corrupt
constexpr int kExtractExitMemoryCap = 11;   // the memory cap was reached
constexpr int kExtractExitNotRegular = 12;  // not a regular file: never opened

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_EXTRACT_PROTOCOL_H_

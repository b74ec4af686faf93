// Text as the orvex tool shows it on a terminal: user-given strings quoted
// so that any byte is visible, the display width of UTF-8 text, aligned
// tables, and the system's error texts with the step that usually cures
// them. Plain functions: safe for concurrent use.
#ifndef ORVEX_PROGRAMS_ORVEX_TERMINAL_TEXT_H_
#define ORVEX_PROGRAMS_ORVEX_TERMINAL_TEXT_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace orvex_cli {

// text in double quotes; control characters and bytes that are not UTF-8
// become \xNN and a backslash "\\", so nothing in it can move the cursor
// or hide another character.
std::string Quote(const std::string& text);

// Terminal columns that text takes: wide and fullwidth characters (CJK,
// most emoji) count two, combining marks, format and control characters
// none, everything else one. A byte that is not UTF-8 counts one (the
// terminal shows a replacement character).
size_t DisplayWidth(const std::string& text);

// text followed by spaces up to width columns (nothing when it is wider).
std::string PadToWidth(const std::string& text, size_t width);

// The rows as lines, each column padded to its widest cell and separated by
// two spaces; the last column is not padded.
std::string FormatTable(const std::vector<std::vector<std::string>>& rows);

// A Unix time as local date and time with its zone, "2026-11-24 21:05:00
// CET"; the number itself when the time cannot be shown.
std::string LocalTime(int64_t seconds);

// strerror(err) as it reads inside a sentence: "permission denied".
std::string Cause(int err);

// What the administrator can do about a failure with errno err, "" when
// there is nothing general to say. ELOOP stands for a symbolic link and
// EISDIR for a directory in a state file's place.
std::string NextStep(int err);

}  // namespace orvex_cli

#endif  // ORVEX_PROGRAMS_ORVEX_TERMINAL_TEXT_H_

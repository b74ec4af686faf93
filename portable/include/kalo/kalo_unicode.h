// UTF-8 text comparison without regard to letter case, by Unicode default
// case folding (ICU), so "é" equals "É" and "ß" equals "SS". Thread-safe.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_UNICODE_H_
#define KALO_KALO_UNICODE_H_

// Compares two NUL-terminated UTF-8 strings after full case folding, in code
// point order of the folded texts. Returns a negative value, 0 or a positive
// value as a sorts before, equal to or after b. When either string is not
// valid UTF-8 the two are compared byte by byte (as strcmp). A null string
// sorts before every other string; two nulls are equal. Never fails.
int KLIBCUnicodeUTF8StrCaseCmp(const char* a, const char* b);

#endif  // KALO_KALO_UNICODE_H_

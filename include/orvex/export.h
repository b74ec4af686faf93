// Symbol visibility for libfileindex. The library is built with hidden
// visibility; only declarations marked ORVEX_EXPORT form its ABI.
#ifndef ORVEX_EXPORT_H_
#define ORVEX_EXPORT_H_

#define ORVEX_EXPORT __attribute__((visibility("default")))

#endif  // ORVEX_EXPORT_H_

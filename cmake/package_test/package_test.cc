// A program outside the tree using an installed libfileindex as any client
// would: a call into the library, and a call through jsoncpp, which the
// package must bring along. Exits 1 when an answer is wrong.
#include <cstdio>

#include "orvex/foundation/json.h"
#include "orvex/policy/file_type.h"
#include "orvex/version.h"

int main() {
  using orvex::fileindex::GetFileTypeByExtension;
  Json::Value value;
  const bool ok = GetFileTypeByExtension("pdf") == orvex::fileindex::kFileTypeDocument &&
                  GetFileTypeByExtension("jpg") == orvex::fileindex::kFileTypeImage &&
                  orvex::fromString(value, "{\"n\": 7}") && value["n"].asInt() == 7;
  std::printf("libfileindex %s: %s\n", ORVEX_VERSION, ok ? "ok" : "WRONG ANSWER");
  return ok ? 0 : 1;
}

#include "orvex/portable/root.h"

#include <cstdlib>

namespace orvex {
namespace portable {

std::string RootPath(const std::string& fixed_path) {
  const char* root = std::getenv("ORVEX_ROOT");
  if (root == nullptr || *root == '\0') return fixed_path;
  std::string rooted(root);
  while (rooted.size() > 1 && rooted.back() == '/') rooted.pop_back();
  if (!fixed_path.empty() && fixed_path.front() != '/') rooted.push_back('/');
  return rooted + fixed_path;
}

}  // namespace portable
}  // namespace orvex

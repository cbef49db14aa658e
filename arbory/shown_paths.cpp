#include "arbory/shown_paths.h"

#include "nas/base/paths.h"

namespace arbory {

ShownPaths::ShownPaths(const std::vector<std::string>& folders) {
  for (const std::string& folder : folders) {
    const auto real = nas::RealPath(folder.empty() ? "." : folder);
    if (!real) continue;
    std::string shown = folder;
    while (shown.ends_with('/')) shown.pop_back();
    if (!folder.empty()) shown += '/';
    roots_.push_back({*real == "/" ? "" : *real, shown});
  }
}

void ShownPaths::AppendFolder(const std::string& real_path, std::string* out) const {
  for (const Root& root : roots_) {
    if (!nas::IsWithin(real_path, root.real)) continue;
    *out += root.shown;
    if (real_path.size() > root.real.size()) {
      out->append(real_path, root.real.size() + 1).append("/");
    }
    return;
  }
  out->append(real_path).append("/");
}

}  // namespace arbory

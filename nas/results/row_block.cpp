#include "nas/results/row_block.h"

#include <algorithm>
#include <cstring>

namespace nas {

bool RowBlock::IsAtOrBelow(std::string_view path, std::string_view folder) {
  if (folder.empty()) return !path.starts_with('/');
  if (!path.starts_with(folder)) return false;
  return path.size() == folder.size() || path[folder.size()] == '/';
}

std::optional<size_t> RowBlock::CountNames(std::string_view names) {
  if (!names.empty() && !names.ends_with('\0')) return std::nullopt;
  size_t count = 0;
  for (char last = '\0'; const char c : names) {
    if (c == '/' || (c == '\0' && last == '\0')) return std::nullopt;
    count += c == '\0' ? 1 : 0;
    last = c;
  }
  return count;
}

void RowBlock::EachFolder(
    const std::function<void(std::string_view path, std::string_view names)>& tell) const {
  std::vector<std::string_view> paths;
  for (std::string_view rest = folders_; !rest.empty();) {
    rest.remove_prefix(sizeof(std::uint16_t));
    paths.push_back(rest.substr(0, rest.find('\0')));
    rest.remove_prefix(paths.back().size() + 1);
  }
  size_t begin = 0;
  size_t end = 0;
  for (size_t row = 0; row < size(); ++row) {
    end = names_.find('\0', end) + 1;
    const std::uint32_t folder = attributes_[row].folder;
    if (row + 1 < size() && attributes_[row + 1].folder == folder) continue;
    tell(paths[folder], std::string_view(names_).substr(begin, end - begin));
    begin = end;
  }
}

void RowBlock::SetFolder(std::uint16_t location, std::string_view path) {
  location_ = location;
  path_ = path;
  folder_written_ = false;
}

void RowBlock::Add(std::string_view name, const FileAttributes& attributes) {
  if (!folder_written_) {
    folders_.append(reinterpret_cast<const char*>(&location_), sizeof(location_));
    folders_.append(path_).push_back('\0');
    ++folder_count_;
    folder_written_ = true;
  }
  names_.append(name).push_back('\0');
  attributes_.push_back(attributes);
  attributes_.back().folder = folder_count_ - 1;
}

bool RowBlock::Assign(std::uint16_t location, std::string_view path, std::string_view folders,
                      std::string_view names, std::string_view attributes) {
  Clear();
  const size_t rows = attributes.size() / sizeof(FileAttributes);
  const bool fits = attributes.size() == rows * sizeof(FileAttributes) && rows <= kMostRows &&
                    CountNames(names) == rows;
  if (!fits) return false;
  std::uint32_t count = 0;
  for (; !folders.empty(); ++count) {
    const size_t end = folders.find('\0', std::min(sizeof(location), folders.size()));
    if (end == std::string_view::npos ||
        !IsAtOrBelow(folders.substr(sizeof(location), end - sizeof(location)), path)) {
      Clear();
      return false;
    }
    folders_.append(reinterpret_cast<const char*>(&location), sizeof(location));
    folders_.append(folders.substr(sizeof(location), end + 1 - sizeof(location)));
    folders.remove_prefix(end + 1);
  }
  attributes_.resize(rows);
  if (rows > 0) std::memcpy(attributes_.data(), attributes.data(), attributes.size());
  const bool numbered = std::ranges::all_of(
      attributes_, [count](const FileAttributes& file) { return file.folder < count; });
  if (!numbered) {
    Clear();
    return false;
  }
  names_ = names;
  folder_count_ = count;
  return true;
}

void RowBlock::Clear() {
  attributes_.clear();
  names_.clear();
  folders_.clear();
  folder_count_ = 0;
  folder_written_ = false;
}

}  // namespace nas

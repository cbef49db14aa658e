#include "nas/results/row_block.h"

namespace nas {

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

void RowBlock::Clear() {
  attributes_.clear();
  names_.clear();
  folders_.clear();
  folder_count_ = 0;
  folder_written_ = false;
}

}  // namespace nas

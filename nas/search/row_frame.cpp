#include "nas/search/row_frame.h"

#include <cstring>

namespace nas {

void WriteRowFrame(const RowBlock& block, std::string& payload) {
  payload.clear();
  for (const std::string_view side : {block.folders(), block.names()}) {
    const auto length = static_cast<std::uint32_t>(side.size());
    payload.append(reinterpret_cast<const char*>(&length), sizeof(length));
  }
  payload.append(block.folders()).append(block.names()).append(block.attributes());
}

bool ReadRowFrame(std::string_view payload, std::uint16_t location, std::string_view path,
                  RowBlock& block) {
  std::uint32_t folders = 0;
  std::uint32_t names = 0;
  if (payload.size() < sizeof(folders) + sizeof(names)) return false;
  std::memcpy(&folders, payload.data(), sizeof(folders));
  std::memcpy(&names, payload.data() + sizeof(folders), sizeof(names));
  payload.remove_prefix(sizeof(folders) + sizeof(names));
  if (std::uint64_t{folders} + names > payload.size()) return false;
  return block.Assign(location, path, payload.substr(0, folders), payload.substr(folders, names),
                      payload.substr(folders + names));
}

}  // namespace nas

#pragma once
// A block of rows as the payload of a frame: 32-bit lengths of folders and names, then the block's
// three sides.

#include <cstdint>
#include <string>
#include <string_view>

#include "nas/results/row_block.h"

namespace nas {

void WriteRowFrame(const RowBlock& block, std::string& payload);
// The rows as those of another location, all at or below `path` in its share. False for what is no
// such block.
bool ReadRowFrame(std::string_view payload, std::uint16_t location, std::string_view path,
                  RowBlock& block);

}  // namespace nas

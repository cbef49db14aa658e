#pragma once
// Extensions, and the categories of files that are told by them. Any thread may call.

#include <string_view>

namespace nas {

enum class FileCategory { kImage, kVideo, kAudio, kDocument, kArchive };

// What follows the last dot, without it; empty where there is none, or where the only dot begins or
// ends the name. A part of `name`, case kept.
std::string_view ExtensionOf(std::string_view name);

// Whether files of that extension (folded, without dot) belong to the category.
bool IsInCategory(std::string_view folded_extension, FileCategory category);

}  // namespace nas

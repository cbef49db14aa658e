#pragma once
// Extensions, and the types of files: what they are, and the categories that extensions tell. Any
// thread may call.

#include <optional>
#include <string_view>

namespace nas {

enum class FileCategory { kImage, kVideo, kAudio, kDocument, kArchive };

struct FileType {
  bool folder = false;
  std::optional<FileCategory> category = {};  // of a file; none: any file
  unsigned char form = 0;  // DT_*, of what is that alone; 0: whatever is no folder
};
// "file", "dir", "image", "video", "audio", "document", "archive" in any letter case; nothing for
// any other word.
std::optional<FileType> ParseFileType(std::string_view word);

// What follows the last dot, without it; empty where there is none, or where the only dot begins or
// ends the name. A part of `name`, case kept.
std::string_view ExtensionOf(std::string_view name);

// Whether files of that extension (folded, without dot) belong to the category.
bool IsInCategory(std::string_view folded_extension, FileCategory category);

}  // namespace nas

#include "nas/match/file_kinds.h"

#include <algorithm>
#include <span>

#include "nas/match/folded_name.h"

namespace nas {
namespace {

// Each list is sorted: it is searched by halving.
constexpr std::string_view kImages[] = {
    "3fr",  "ai",  "arw", "avif", "bmp", "cr2", "cr3",  "dcr",  "dng",  "eps", "erf", "gif", "heic",
    "heif", "ico", "iiq", "jfif", "jp2", "jpe", "jpeg", "jpg",  "jxl",  "k25", "kdc", "mef", "mos",
    "mrw",  "nef", "nrw", "orf",  "pcx", "pef", "pgm",  "png",  "pnm",  "ppm", "psd", "raf", "raw",
    "rw2",  "sr2", "srf", "srw",  "svg", "tga", "tif",  "tiff", "webp", "x3f", "xbm", "xcf", "xpm"};
constexpr std::string_view kVideos[] = {
    "3g2", "3gp",  "amv", "asf", "avi", "divx", "f4v", "flv",  "ifo", "m2t", "m2ts", "m2v",
    "m4v", "mkv",  "mov", "mp4", "mpe", "mpeg", "mpg", "mts",  "mxf", "ogm", "ogv",  "qt",
    "rm",  "rmvb", "swf", "tp",  "trp", "ts",   "vob", "webm", "wmv", "xvid"};
constexpr std::string_view kAudios[] = {
    "aac",  "aif", "aifc", "aiff", "alac", "amr",  "ape", "au",  "caf",  "dff", "dsf",
    "flac", "m4a", "m4b",  "m4p",  "mid",  "midi", "mka", "mp1", "mp2",  "mp3", "mpc",
    "oga",  "ogg", "opus", "ra",   "snd",  "tak",  "tta", "wav", "weba", "wma", "wv"};
constexpr std::string_view kDocuments[] = {
    "abw",  "azw", "azw3", "csv",   "djvu", "doc",      "docm",  "docx", "dot",   "dotx", "epub",
    "fb2",  "htm", "html", "key",   "log",  "markdown", "md",    "mht",  "mhtml", "mobi", "numbers",
    "odg",  "odp", "ods",  "odt",   "one",  "org",      "pages", "pdf",  "pot",   "potx", "pps",
    "ppsx", "ppt", "pptm", "pptx",  "ps",   "rst",      "rtf",   "tex",  "tsv",   "txt",  "vsd",
    "vsdx", "wpd", "wps",  "xhtml", "xls",  "xlsb",     "xlsm",  "xlsx", "xlt",   "xml",  "xps"};
constexpr std::string_view kArchives[] = {
    "7z",   "ace", "apk", "ar",  "arj",  "br",  "bz",  "bz2",  "cab", "cpio", "deb",
    "dmg",  "ear", "gz",  "img", "iso",  "jar", "lha", "lz",   "lz4", "lzh",  "lzma",
    "lzo",  "rar", "rpm", "sit", "sitx", "tar", "tbz", "tbz2", "tgz", "tlz",  "txz",
    "tzst", "war", "wim", "xar", "xz",   "z",   "zip", "zipx", "zst"};

constexpr bool AllSorted() {
  return std::ranges::is_sorted(kImages) && std::ranges::is_sorted(kVideos) &&
         std::ranges::is_sorted(kAudios) && std::ranges::is_sorted(kDocuments) &&
         std::ranges::is_sorted(kArchives);
}
static_assert(AllSorted());

std::span<const std::string_view> ExtensionsOf(FileCategory category) {
  switch (category) {
    case FileCategory::kImage:
      return kImages;
    case FileCategory::kVideo:
      return kVideos;
    case FileCategory::kAudio:
      return kAudios;
    case FileCategory::kDocument:
      return kDocuments;
    case FileCategory::kArchive:
      return kArchives;
  }
  return {};
}

}  // namespace

std::optional<FileType> ParseFileType(std::string_view word) {
  static constexpr struct {
    std::string_view word;
    FileType type;
  } kTypes[] = {{"file", {}},
                {"dir", {true}},
                {"image", {false, FileCategory::kImage}},
                {"video", {false, FileCategory::kVideo}},
                {"audio", {false, FileCategory::kAudio}},
                {"document", {false, FileCategory::kDocument}},
                {"archive", {false, FileCategory::kArchive}}};
  const std::string lowered = AsciiLower(word);
  for (const auto& known : kTypes) {
    if (lowered == known.word) return known.type;
  }
  return std::nullopt;
}

std::string_view ExtensionOf(std::string_view name) {
  const size_t dot = name.rfind('.');
  if (dot == std::string_view::npos || dot == 0 || dot + 1 == name.size()) return {};
  return name.substr(dot + 1);
}

bool IsInCategory(std::string_view folded_extension, FileCategory category) {
  return std::ranges::binary_search(ExtensionsOf(category), folded_extension);
}

}  // namespace nas

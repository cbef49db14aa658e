#include "arbory/path_template.h"

namespace arbory {
namespace {

constexpr size_t npos = std::string_view::npos;

std::string_view NameOf(std::string_view path) { return path.substr(path.rfind('/') + 1); }

std::string_view FolderOf(std::string_view path) {
  const size_t slash = path.rfind('/');
  if (slash == npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

// Without what follows the last dot of the name, unless that begins it.
std::string_view StemOf(std::string_view path) {
  const std::string_view name = NameOf(path);
  const size_t dot = name.rfind('.');
  return dot == npos || dot == 0 ? path : path.substr(0, path.size() - (name.size() - dot));
}

std::string_view WithoutHere(std::string_view path) {
  return path.starts_with("./") ? path.substr(2) : path;
}

}  // namespace

PathTemplate::PathTemplate(std::string_view text) {
  const struct {
    std::string_view place;
    Kind kind;
  } places[] = {{"{}", Kind::kPath},
                {"{/}", Kind::kName},
                {"{//}", Kind::kFolder},
                {"{.}", Kind::kPathStem},
                {"{/.}", Kind::kNameStem}};
  while (!text.empty()) {
    size_t length = 1;
    for (const auto& [place, kind] : places) {
      if (!text.starts_with(place)) continue;
      pieces_.push_back({kind, ""});
      has_places_ = true;
      length = 0;
      text.remove_prefix(place.size());
      break;
    }
    if (length == 0) continue;
    if (text.starts_with("{{") || text.starts_with("}}")) length = 2;
    AddText(text.front());
    text.remove_prefix(length);
  }
}

void PathTemplate::AddText(char c) {
  if (pieces_.empty() || pieces_.back().kind != Kind::kText) pieces_.push_back({Kind::kText, ""});
  pieces_.back().text += c;
}

void PathTemplate::Append(std::string_view path, std::string* out) const {
  for (const Piece& piece : pieces_) {
    switch (piece.kind) {
      case Kind::kText:
        *out += piece.text;
        break;
      case Kind::kPath:
        *out += path;
        break;
      case Kind::kName:
        *out += NameOf(path);
        break;
      case Kind::kFolder:
        *out += FolderOf(path);
        break;
      case Kind::kPathStem:
        *out += WithoutHere(StemOf(path));
        break;
      case Kind::kNameStem:
        *out += StemOf(NameOf(path));
        break;
    }
  }
}

std::string PathTemplate::Of(std::string_view path) const {
  std::string out;
  Append(path, &out);
  return out;
}

}  // namespace arbory

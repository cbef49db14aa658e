#include "arbory/server/transport/http.h"

#include <algorithm>

namespace arbory {

const std::string* HttpRequest::Field(std::string_view name) const {
  const auto found =
      std::find_if(fields.begin(), fields.end(), [&](const auto& f) { return f.first == name; });
  return found == fields.end() ? nullptr : &found->second;
}

size_t HttpRequest::CountOf(std::string_view name) const {
  return std::count_if(fields.begin(), fields.end(),
                       [&](const auto& f) { return f.first == name; });
}

std::string_view HttpRequest::path() const {
  return std::string_view(target).substr(0, target.find('?'));
}

std::string_view HttpRequest::query() const {
  const size_t mark = target.find('?');
  return mark == std::string::npos ? std::string_view() : std::string_view(target).substr(mark + 1);
}

}  // namespace arbory

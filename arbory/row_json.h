#pragma once
// Rows as JSON objects. Their strings are always valid UTF-8; where that is not what is on disk,
// the bytes stand beside them in base64, as NAME_base64.

#include <string>
#include <string_view>

#include "nas/base/accounts.h"
#include "nas/match/content_scanner.h"
#include "nas/results/block_reader.h"

namespace arbory {

// For one thread.
class JsonRows {
 public:
  // The rows that follow lie there; each with a final "/" where it is not empty.
  void EnterFolder(std::string_view real_folder, std::string_view shown_folder);

  // Appends a row's object but for its end, to which the lines belong.
  void Append(const nas::ResultRow& row, std::string* out);
  // `context`: the line does not match itself.
  static void AppendLine(const nas::MatchingLine& line, bool context, bool first, std::string* out);

  nas::AccountTexts& owners() { return owners_; }

 private:
  // A text, its JSON without the quotation marks, and whether that is all of it.
  struct Text {
    std::string bytes;
    std::string json;
    bool whole = true;
  };
  static void Set(std::string_view bytes, Text* text);
  static void AppendPath(const char* name, const Text& folder, const Text& file, std::string* out);
  void AppendOwner(const nas::FileAttributes& file, std::string* out);

  nas::AccountTexts owners_;
  Text real_folder_;
  Text shown_folder_;
  Text name_;
};

// All of the object as a terminal may show it: control characters that JSON lets stand are written
// with their numbers.
void AppendShownJson(std::string_view json, std::string* out);

}  // namespace arbory

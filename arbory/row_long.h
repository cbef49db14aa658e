#pragma once
// What stands before the path where a row is printed with what is known of the file, as by ls -l.

#include <string>

#include "nas/base/accounts.h"
#include "nas/files/attributes.h"

namespace arbory {

// For one thread.
class LongColumns {
 public:
  // Appends mode, owner, group, size and time, each with a space behind it. Columns have fixed
  // least widths, as rows are printed before the next ones are known.
  void Append(const nas::FileAttributes& file, std::string* out);
  nas::AccountTexts& owners() { return owners_; }

 private:
  nas::AccountTexts owners_;
};

}  // namespace arbory

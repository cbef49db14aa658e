#pragma once
// What matching by PCRE2 needs besides an expression. For the sources that run expressions alone.

#define PCRE2_CODE_UNIT_WIDTH 8
#include <pcre2.h>

#include <cstddef>
#include <cstdint>

namespace nas {

// One for each thread.
class PcreScratch {
 public:
  static PcreScratch& OfThread() {
    thread_local PcreScratch scratch;
    return scratch;
  }
  // Throws std::bad_alloc.
  PcreScratch();
  ~PcreScratch();
  PcreScratch(const PcreScratch&) = delete;
  PcreScratch& operator=(const PcreScratch&) = delete;

  pcre2_match_data* match() const { return match_; }
  pcre2_match_context* context() const { return context_; }

 private:
  pcre2_match_data* match_;
  pcre2_match_context* context_;
  pcre2_jit_stack* stack_;
};

}  // namespace nas

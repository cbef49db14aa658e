#include "nas/match/pcre.h"

#include <new>

namespace nas {
namespace {

// Backtracking steps in one search of one text: a second or so at worst for the most hostile
// expression, far above what honest ones need.
constexpr std::uint32_t kMatchLimit = 2'000'000;
// Machine stack for compiled code, grown on demand; the built-in 32 KiB is too little for
// expressions with many alternatives.
constexpr size_t kJitStackStart = 32 * 1024;
constexpr size_t kJitStackMost = 1024 * 1024;

}  // namespace

PcreScratch::PcreScratch()
    : match_(pcre2_match_data_create(1, nullptr)),
      context_(pcre2_match_context_create(nullptr)),
      stack_(pcre2_jit_stack_create(kJitStackStart, kJitStackMost, nullptr)) {
  if (match_ == nullptr || context_ == nullptr) throw std::bad_alloc();
  pcre2_set_match_limit(context_, kMatchLimit);
  if (stack_ != nullptr) pcre2_jit_stack_assign(context_, nullptr, stack_);
}

PcreScratch::~PcreScratch() {
  pcre2_jit_stack_free(stack_);
  pcre2_match_context_free(context_);
  pcre2_match_data_free(match_);
}

}  // namespace nas

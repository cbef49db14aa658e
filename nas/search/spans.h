// Spans that lie end to end, by what they begin at: the texts of a table, and its folders' entries.
#pragma once

#include <cstdint>

namespace nas {

// The number of the span, of `end`, that holds what is at `offset`: `from` or a later one, and most
// often one that is near. `begin_of(number)` rises with the number; that of `from` is not beyond
// `offset`.
template <class Number, class BeginOf>
Number SpanFrom(const BeginOf& begin_of, Number from, Number end, std::uint64_t offset) {
  Number step = 1;
  while (step < end - from && begin_of(from + step) <= offset) {
    from += step;
    step *= 2;
  }
  for (; step > 0; step /= 2) {
    if (step < end - from && begin_of(from + step) <= offset) from += step;
  }
  return from;
}

}  // namespace nas

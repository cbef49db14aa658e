#pragma once
// Where the rows of a search go: a result database, or whatever else takes blocks of them.

#include "nas/results/row_block.h"

namespace nas {

class RowSink {
 public:
  virtual ~RowSink() = default;
  // Takes the block's rows and empties it; does nothing for an empty one. Callable from any thread
  // of a search. Throws where the rows cannot be taken, which ends the search; the block then keeps
  // them.
  virtual void Append(RowBlock& block) = 0;
};

}  // namespace nas

#pragma once
// The answering of one question (index_question.h), in a process of its own that has become the
// asker: a search like any other, whose names come from the index and whose rows go to the
// connection.

#include "nas/base/unique_fd.h"
#include "nas/index/changes.h"

namespace nas {

// Reads the question, waiting a bounded time for it, and answers it; returns when the answer is
// whole, cannot be had, or nobody waits for it any more. `location` is the folder that the asker
// has handed over. The process must be the asker's; threads are started and have ended.
void AnswerQuestion(int connection, UniqueFd location, const IndexSnapshot& snapshot);

}  // namespace nas

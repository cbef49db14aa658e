#include "nas/search/index_answer.h"

#include <poll.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdint>
#include <exception>
#include <mutex>
#include <system_error>
#include <utility>
#include <vector>

#include "nas/index/frames.h"
#include "nas/search/index_best.h"
#include "nas/search/index_names.h"
#include "nas/search/index_question.h"
#include "nas/search/row_frame.h"
#include "nas/search/search_job.h"

namespace nas {
namespace {

// For a question to come once it was announced.
constexpr int kQuestionMilliseconds = 10'000;

// Sends what a search finds. A connection that takes no more ends the search.
class FrameSink : public RowSink, public CandidateSink, public UnreadSink {
 public:
  explicit FrameSink(int connection) : connection_(connection) {}

  void Append(RowBlock& block) override {
    if (block.size() == 0) return;
    const std::lock_guard lock(mutex_);
    WriteRowFrame(block, payload_);
    Send(FrameType::kRows, payload_);
    block.Clear();
  }

  void Add(std::uint16_t /*location*/, std::string_view folder_path,
           std::string_view names) override {
    const std::lock_guard lock(mutex_);
    payload_.assign(folder_path).push_back('\0');
    payload_.append(names);
    Send(FrameType::kCandidates, payload_);
  }

  void AddUnread(int error_number, std::uint16_t /*location*/, std::string_view path) override {
    const std::lock_guard lock(mutex_);
    payload_.assign(reinterpret_cast<const char*>(&error_number), sizeof(error_number));
    payload_.append(path);
    Send(FrameType::kUnread, payload_);
  }

  void Tell(const WalkProgress& progress) {
    const WalkProgress::Counts counts = progress.counts();
    const std::lock_guard lock(mutex_);
    Send(FrameType::kProgress, {reinterpret_cast<const char*>(&counts), sizeof(counts)});
  }

  void End(std::string_view payload = {}) {
    const std::lock_guard lock(mutex_);
    Send(FrameType::kEnd, payload);
  }

 private:
  void Send(FrameType type, std::string_view payload) {
    if (const Status sent = SendFrame(connection_, type, payload); !sent) {
      throw std::system_error(sent.error().error_number, std::generic_category(), "answer");
    }
  }

  const int connection_;
  std::mutex mutex_;  // guards payload_ and the order of frames
  std::string payload_;
};

bool HasGone(int connection) {
  pollfd end{connection, POLLRDHUP, 0};
  return poll(&end, 1, 0) > 0 && (end.revents & (POLLRDHUP | POLLHUP | POLLERR)) != 0;
}

// Contents are read by the asker.
class NoNames : public NameSource {
 public:
  void Feed(size_t /*thread*/, Judge& /*judge*/) override {}
};

void AnswerFrom(int connection, const IndexQuestion& question,
                const std::vector<Location>& locations, const IndexSnapshot& snapshot) {
  const auto folder = IndexNames::FolderOf(snapshot, locations.front());
  if (folder == NameTable::kNoFolder) {
    (void)SendFrame(connection, FrameType::kStatus, "new folder");
    return;
  }
  FrameSink sink(connection);
  int stop = 0;
  NodeComp query(question.query);
  SharedSearch search({&query}, sink, stop);
  search.AskContents(question.texts_too);
  search.candidate_sink = &sink;
  if (question.unread) search.unread = &sink;
  search.names_alone = question.names_alone;
  IndexNames names(snapshot, {locations, folder, question.mounts, question.rules}, search);
  NoNames contents;
  if (question.best > 0) {
    const BestCount count = FindBest(names, snapshot, locations.front(), search, question.best);
    sink.End({reinterpret_cast<const char*>(&count), sizeof(count)});
    return;
  }
  const auto report = [&](const WalkProgress& progress) {
    if (HasGone(connection)) {
      __atomic_store_n(&stop, 1, __ATOMIC_RELAXED);
    } else {
      sink.Tell(progress);
    }
  };
  SearchJob job(search, {.report = report, .stuck = [] { _exit(0); }});
  if (!job.Run(names, contents)) return;
  sink.Tell(search.progress);
  sink.End();
}

}  // namespace

void AnswerQuestion(int connection, UniqueFd location, const IndexSnapshot& snapshot) try {
  FrameReader reader(connection, kMaxQuestionBytes);
  Frame frame;
  if (reader.Read(kQuestionMilliseconds, &frame) != FrameReader::State::kFrame) return;
  const auto question = ReadQuestion(frame.payload);
  struct stat status;
  if (!question || fstat(location.get(), &status) != 0) {
    (void)SendFrame(connection, FrameType::kStatus, "question not understood");
    return;
  }
  std::vector<Location> locations;
  locations.push_back(
      {question->share, question->path, std::move(location), status.st_dev, status.st_ino});
  AnswerFrom(connection, *question, locations, snapshot);
} catch (const std::exception& error) {
  syslog(LOG_NOTICE, "index: a question was not answered to its end: %s", error.what());
}

}  // namespace nas

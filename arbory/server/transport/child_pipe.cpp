#include "arbory/server/transport/child_pipe.h"

#include <signal.h>
#include <unistd.h>

#include <boost/asio/post.hpp>
#include <cerrno>
#include <exception>

#include "nas/base/system_call.h"

namespace arbory {
namespace {

// What a pipe holds; more would never come at once.
constexpr size_t kReadBytes = size_t{64} << 10;

// One for all, as the loop has one thread and readers take what they want at once: room for each
// call would be cleared, and given back to the system, for each call.
char g_buffer[kReadBytes];

}  // namespace

ChildPipe::ChildPipe(boost::asio::io_context& loop, nas::Child child, std::shared_ptr<void> token,
                     std::chrono::seconds patience)
    : pipe_(loop), timer_(loop), pid_(child.pid), token_(std::move(token)), patience_(patience) {
  pipe_.assign(child.fd.get());
  child.fd.Release();  // only now: what cannot be watched is still to be closed
  pipe_.native_non_blocking(true);
}

void ChildPipe::Read(Reader reader) {
  reader_ = std::move(reader);
  try {
    Watch();
    Wait();
  } catch (const std::exception&) {
    // The timer holds this, and a reader would be held with it, and its client left to wait.
    reader_ = nullptr;
    Kill();
    throw;
  }
}

void ChildPipe::Wait() {
  if (exited_) {
    boost::asio::post(pipe_.get_executor(),
                      [self = shared_from_this()] { self->Deliver(/*may_wait=*/false); });
    return;
  }
  pipe_.async_wait(boost::asio::posix::stream_descriptor::wait_read,
                   [self = shared_from_this()](boost::system::error_code) {
                     self->Deliver(/*may_wait=*/!self->exited_);
                   });
}

void ChildPipe::Deliver(bool may_wait) {
  if (!reader_ || !pipe_.is_open()) return;
  const ssize_t count =
      nas::Uninterrupted([this] { return read(pipe_.native_handle(), g_buffer, sizeof g_buffer); });
  if (count < 0 && errno == EAGAIN && may_wait) return Wait();
  timer_.cancel();  // from here on it is the client who is waited for
  const Reader reader = std::move(reader_);
  reader_ = nullptr;
  reader(std::string_view(g_buffer, count > 0 ? static_cast<size_t>(count) : 0));
}

void ChildPipe::Watch() {
  timer_.cancel();
  if (exited_) return;
  timer_.expires_after(patience_);
  timer_.async_wait([self = shared_from_this()](boost::system::error_code error) {
    if (!error) self->Kill();
  });
}

void ChildPipe::Close() {
  reader_ = nullptr;
  boost::system::error_code ignored;
  pipe_.close(ignored);
  try {
    Watch();
  } catch (const std::exception&) {
    Kill();
  }
}

void ChildPipe::OnExit() {
  exited_ = true;
  token_.reset();
  timer_.cancel();
  boost::system::error_code ignored;
  if (pipe_.is_open()) pipe_.cancel(ignored);  // a waiting reader looks once more
}

void ChildPipe::Kill() {
  if (!exited_) kill(pid_, SIGKILL);
}

}  // namespace arbory

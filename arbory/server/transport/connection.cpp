#include "arbory/server/transport/connection.h"

#include <syslog.h>

#include <algorithm>
#include <boost/asio/buffer.hpp>
#include <boost/beast/http/error.hpp>
#include <boost/beast/http/read.hpp>
#include <boost/beast/http/status.hpp>
#include <ctime>
#include <exception>

#include "arbory/server/transport/addresses.h"
#include "arbory/server/transport/http_text.h"

namespace arbory {
namespace {

namespace asio = boost::asio;
namespace http = boost::beast::http;
using std::chrono::seconds;

// A target of a deep path in a multi-byte script, encoded, and the fields of a browser behind
// proxies fit easily; it is what one connection may make the server hold before it is known.
constexpr std::uint32_t kMaxHeaderBytes = 32 << 10;
// What is read ahead of a request: one whole header and the beginnings of more.
constexpr size_t kMaxReadAhead = size_t{64} << 10;
constexpr size_t kReadBytes = size_t{16} << 10;
// Written at once: each such piece that a client takes restarts its time.
constexpr size_t kWriteBytes = size_t{256} << 10;
// After the last reply, for a client that is still sending, so that the reply is not lost to a
// reset.
constexpr int kLingerSeconds = 1;

constexpr unsigned kHttp11 = 11;

constexpr char kEveryReply[] =
    "X-Content-Type-Options: nosniff\r\n"
    "Referrer-Policy: no-referrer\r\n"
    "Cross-Origin-Resource-Policy: same-origin\r\n";

// Made anew once a second, not for each reply.
const std::string& DateNow() {
  static std::time_t last = 0;
  static std::string text;
  const std::time_t now = std::time(nullptr);
  if (now != last) text = HttpDate(last = now);
  return text;
}

std::string_view ReasonPhrase(int status) {
  if (status == kTooLarge) return "Content Too Large";  // the library has its former name
  const auto phrase = http::obsolete_reason(http::int_to_status(status));
  return {phrase.data(), phrase.size()};
}

// The parser takes a body in any other transfer encoding for none, or for one of Content-Length
// bytes; a proxy that takes it otherwise would see other requests than this server.
bool EndsClearly(const HttpRequest& request) {
  constexpr char kField[] = "transfer-encoding";
  const std::string* encoding = request.Field(kField);
  return encoding == nullptr || (request.CountOf(kField) == 1 && LowerCase(*encoding) == "chunked");
}

}  // namespace

Connection::Connection(ConnectionHost* host, asio::ip::tcp::socket socket)
    : host_(host),
      socket_(std::move(socket)),
      deadline_(host->loop()),
      delay_(host->loop()),
      in_(kMaxReadAhead) {}

Connection::~Connection() { host_->Closed(this); }

void Connection::Start() {
  Error error;
  socket_.set_option(asio::ip::tcp::no_delay(true), error);
  const auto peer = socket_.remote_endpoint(error);
  if (error) return;
  peer_ = peer.address().to_string();
  network_ = NetworkOf(peer_);
  AwaitRequest();
}

void Connection::Stop() {
  keep_alive_ = false;
  if (stage_ == Stage::kIdle) Drop();
}

void Connection::Abort() {
  if (child_) child_->Kill();
  Drop();
}

void Connection::Arm(int limit) {
  timed_out_ = false;
  deadline_.expires_after(seconds(limit));
  deadline_.async_wait([weak = weak_from_this()](Error error) {
    const auto self = weak.lock();
    // A timer may have run out just before it was set anew.
    if (error || !self || self->deadline_.expiry() > Clock::now()) return;
    self->timed_out_ = true;
    Error ignored;
    self->socket_.cancel(ignored);
  });
}

void Connection::Enter(Stage stage) {
  stage_ = stage;
  since_ = Clock::now();
}

void Connection::AwaitRequest() {
  Enter(Stage::kIdle);
  if (host_->stopping()) return Drop();
  if (in_.size() > 0) return ReadHeader();
  // What a large request or reply needed is not kept for the time until the next one.
  if (in_.capacity() > kReadBytes) in_.shrink_to_fit();
  if (out_.capacity() > kReadBytes) std::string().swap(out_);
  Arm(host_->settings().idle_seconds);
  socket_.async_read_some(in_.prepare(kReadBytes),
                          [self = shared_from_this()](Error error, size_t count) {
                            if (error) return self->Drop();
                            self->in_.commit(count);
                            self->ReadHeader();
                          });
}

void Connection::ReadHeader() {
  Enter(Stage::kReading);
  status_ = 0;
  sent_ = 0;
  keep_alive_ = false;
  request_.method.clear();
  request_.target.clear();
  request_.fields.clear();
  ForgetBody();
  request_.user.clear();
  SetClient();
  request_.begun = Clock::now();
  parser_.emplace();
  parser_->header_limit(kMaxHeaderBytes);
  parser_->body_limit(static_cast<std::uint64_t>(host_->settings().body_bytes));
  Arm(host_->settings().header_seconds);
  http::async_read_header(socket_, in_, *parser_, [self = shared_from_this()](Error error, size_t) {
    self->OnHeader(error);
  });
}

void Connection::SetClient() {
  const ClientAddress client = host_->proxies().ClientOf(peer_, request_);
  request_.peer = client.text;
  request_.from_loopback = client.loopback;
}

void Connection::OnHeader(Error error) {
  if (parser_->is_header_done()) {
    const auto& message = parser_->get();
    request_.method = std::string(message.method_string());
    request_.target = std::string(message.target());
    for (const auto& field : message) {
      const std::string name(field.name_string());
      request_.fields.emplace_back(LowerCase(name), std::string(field.value()));
    }
    UseHostOfTarget(&request_);
    SetClient();
  }
  if (error) return OnReadError(error);
  if (!EndsClearly(request_)) return OnReadError(http::error::bad_transfer_encoding);
  parser_->get().body().room = host_->service().RoomFor(request_);
  const std::string* expect = request_.Field("expect");
  if (expect == nullptr) return ReadBody();
  out_ = "HTTP/1.1 100 Continue\r\n\r\n";
  Write(&Connection::ReadBody);
}

void Connection::ReadBody() {
  sent_ = 0;
  Arm(host_->settings().header_seconds);
  parser_->eager(true);
  if (parser_->is_done()) return Dispatch();
  ReadPiece();
}

void Connection::ReadPiece() {
  if (timed_out_) return OnReadError(asio::error::operation_aborted);
  http::async_read_some(socket_, in_, *parser_,
                        [self = shared_from_this()](Error error, size_t) { self->OnPiece(error); });
}

// A body that is not held is read so that its client comes to the reply, which is for its client
// alone to wait for: many such bodies at once are no reason for the others to.
void Connection::OnPiece(Error error) {
  if (error) return OnReadError(error);
  if (parser_->is_done()) return Dispatch();
  if (parser_->get().body().room) return ReadPiece();
  socket_.async_wait(asio::socket_base::wait_read, [self = shared_from_this()](Error waited) {
    if (waited) return self->OnReadError(waited);
    self->host_->turns().Await([self] { self->ReadPiece(); });
  });
}

void Connection::OnReadError(Error error) {
  if (timed_out_) return Refuse(kTimeout, "The request did not arrive in time; send it again.");
  if (error == http::error::body_limit) {
    return Refuse(kTooLarge, "The request is too large; send fewer or shorter parameters.");
  }
  if (error == http::error::header_limit || error == http::error::buffer_overflow) {
    return Refuse(kHeaderTooLarge, "The request's header is too large; shorten its address.");
  }
  if (error.category() != make_error_code(http::error::bad_method).category() ||
      error == http::error::end_of_stream) {
    return Drop();
  }
  Refuse(kBadRequest, "This is not a well-formed HTTP request.");
}

void Connection::Refuse(int status, const char* sentence) {
  keep_alive_ = false;
  Enter(Stage::kAnswering);
  SendNow(ErrorReply(status, sentence));
}

void Connection::Dispatch() {
  keep_alive_ = parser_->keep_alive() && !host_->stopping();
  Enter(Stage::kAnswering);
  HeldBody::value_type& body = parser_->get().body();
  request_.body = std::move(body.bytes);
  request_.body_bytes = body.came;
  request_.room = std::move(body.room);
  Answer answer = HandleSafely();
  // A child that needs it has its own by now.
  ForgetBody();
  if (auto* reply = std::get_if<HttpReply>(&answer)) return Send(std::move(*reply));
  AwaitChild(std::move(std::get<ChildAnswer>(answer)));
}

void Connection::ForgetBody() {
  std::string().swap(request_.body);
  request_.room.reset();
  request_.body_bytes = 0;
  if (parser_) parser_->get().body() = {};
}

// One request's trouble, such as no memory for its answer, is not the others'.
Answer Connection::HandleSafely() {
  try {
    return host_->service().Handle(&request_);
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "%s %s: %s", request_.method.c_str(), request_.target.c_str(), error.what());
    return ErrorReply(kUnavailable, "The server failed here; try again.");
  }
}

void Connection::AwaitChild(ChildAnswer answer) {
  make_reply_ = std::move(answer.make_reply);
  if (answer.child.pid < 0) return OnChildHead(nullptr);
  child_ = host_->Adopt(&answer);
  head_reader_.emplace();
  deadline_.cancel();
  child_->Read([self = shared_from_this()](std::string_view bytes) { self->OnChildBytes(bytes); });
}

void Connection::OnChildBytes(std::string_view bytes) {
  const auto state = bytes.empty() ? nas::ReplyReader::State::kBroken : head_reader_->Feed(bytes);
  if (state == nas::ReplyReader::State::kMore) {
    child_->Read([self = shared_from_this()](std::string_view more) { self->OnChildBytes(more); });
  } else {
    OnChildHead(state == nas::ReplyReader::State::kReady ? &head_reader_->head() : nullptr);
  }
}

void Connection::OnChildHead(const nas::ReplyHead* head) {
  const auto make_reply = std::move(make_reply_);
  HttpReply reply = make_reply(head);
  const bool relays = reply.child_follows && head != nullptr && request_.method != "HEAD";
  if (!relays && child_) {
    child_->Close();
    child_.reset();
  }
  Send(std::move(reply));
}

void Connection::Send(HttpReply reply) {
  if (!reply.not_before || *reply.not_before <= Clock::now()) return SendNow(std::move(reply));
  delay_.expires_at(*reply.not_before);
  delay_.async_wait([self = shared_from_this(), reply = std::move(reply)](Error error) mutable {
    if (!error) self->SendNow(std::move(reply));
  });
}

void Connection::SendNow(HttpReply reply) {
  const bool relays = reply.child_follows && head_reader_;
  const std::uint64_t length = relays ? head_reader_->body_bytes() : reply.body.size();
  if (length == nas::kUntilEnd) {
    if (parser_->get().version() < kHttp11) return RefuseOldClient();
    keep_alive_ = false;  // the body's own end is not looked for here
  }
  status_ = reply.status;
  out_ = HeadText(reply, length);
  if (request_.method != "HEAD") {
    out_ += relays ? head_reader_->body_begin() : std::string_view(reply.body);
  }
  body_left_ = 0;
  if (child_)
    body_left_ = length == nas::kUntilEnd ? length : length - head_reader_->body_begin().size();
  head_reader_.reset();
  Write(&Connection::OnSent);
}

void Connection::OnSent() {
  if (!child_) return FinishRequest();
  if (body_left_ > 0) return Relay();
  child_->Close();
  child_.reset();
  FinishRequest();
}

// Chunks are the child's own, which old clients do not know.
void Connection::RefuseOldClient() {
  if (child_) child_->Close();
  child_.reset();
  head_reader_.reset();
  Refuse(kOldVersion, "Ask for this with HTTP/1.1.");
}

void Connection::Relay() {
  child_->Read([self = shared_from_this()](std::string_view bytes) {
    const bool until_end = self->body_left_ == nas::kUntilEnd;
    if (bytes.empty() && until_end) {
      self->body_left_ = 0;
      return self->OnSent();
    }
    // Without the rest that was announced, only an early end tells the client.
    if (bytes.empty()) return self->Drop();
    const size_t count = std::min<std::uint64_t>(bytes.size(), self->body_left_);
    if (!until_end) self->body_left_ -= count;
    self->out_.assign(bytes.substr(0, count));
    self->Write(&Connection::OnSent);
  });
}

std::string Connection::HeadText(const HttpReply& reply, std::uint64_t length) const {
  std::string text = "HTTP/1.1 " + std::to_string(reply.status) + " " +
                     std::string(ReasonPhrase(reply.status)) + "\r\n";
  for (const auto& [name, value] : reply.fields) text += name + ": " + value + "\r\n";
  text += "Date: " + DateNow() + "\r\n";
  text += kEveryReply;
  if (length == nas::kUntilEnd) {
    text += "Transfer-Encoding: chunked\r\n";
  } else {
    text += "Content-Length: " + std::to_string(length) + "\r\n";
  }
  if (!keep_alive_) {
    text += "Connection: close\r\n";
  } else if (parser_ && parser_->get().version() < kHttp11) {
    text += "Connection: keep-alive\r\n";
  }
  return text + "\r\n";
}

void Connection::Write(void (Connection::*then)()) {
  if (out_at_ == out_.size()) {
    out_.clear();
    out_at_ = 0;
    return (this->*then)();
  }
  const size_t count = std::min(out_.size() - out_at_, kWriteBytes);
  Arm(host_->settings().stall_seconds);
  socket_.async_write_some(asio::buffer(out_.data() + out_at_, count),
                           [self = shared_from_this(), then](Error error, size_t written) {
                             if (error) return self->Drop();
                             self->out_at_ += written;
                             self->sent_ += written;
                             self->Write(then);
                           });
}

void Connection::FinishRequest() {
  host_->service().Finished(request_, status_, sent_);
  status_ = 0;
  if (keep_alive_) return AwaitRequest();
  Error ignored;
  socket_.shutdown(asio::ip::tcp::socket::shutdown_send, ignored);
  Arm(kLingerSeconds);
  Linger();
}

void Connection::Linger() {
  in_.clear();
  socket_.async_read_some(in_.prepare(kReadBytes),
                          [self = shared_from_this()](Error error, size_t) {
                            if (error) return self->Drop();
                            self->Linger();
                          });
}

void Connection::Drop() {
  Enter(Stage::kEnded);
  if (child_) {
    child_->Close();
    child_.reset();
  }
  if (status_ != 0) {
    host_->service().Finished(request_, status_, sent_);
    status_ = 0;
  }
  delay_.cancel();
  deadline_.cancel();
  Error ignored;
  // A child that is just being forked has the socket too: closing alone would not end it.
  socket_.shutdown(asio::ip::tcp::socket::shutdown_both, ignored);
  socket_.close(ignored);
}

}  // namespace arbory

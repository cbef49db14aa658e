#pragma once
// One client's connection: reads a request, has it answered, writes the reply, and so on. It keeps
// itself alive by what it waits for and ends by itself; every wait has a bound, which the settings
// give. Of the loop's thread alone. Included only where the network library is.

#include <boost/asio/io_context.hpp>
#include <boost/asio/ip/tcp.hpp>
#include <boost/asio/steady_timer.hpp>
#include <boost/beast/core/flat_buffer.hpp>
#include <boost/beast/http/parser.hpp>
#include <memory>
#include <optional>
#include <string>

#include "arbory/server/transport/child_pipe.h"
#include "arbory/server/transport/held_body.h"
#include "arbory/server/transport/http.h"
#include "arbory/server/transport/turns.h"
#include "nas/system/child.h"
#include "nas/system/config.h"

namespace arbory {

class Connection;
class Proxies;

// What connections need of the server they belong to, which outlives them.
class ConnectionHost {
 public:
  virtual ~ConnectionHost() = default;
  virtual boost::asio::io_context& loop() = 0;
  virtual const nas::ServerSettings& settings() const = 0;
  virtual const Proxies& proxies() const = 0;
  virtual HttpService& service() = 0;
  virtual bool stopping() const = 0;
  // For what no reply waits for.
  virtual Turns& turns() = 0;
  // Takes the child and its token over: it is reaped there, and killed when it stays silent.
  virtual std::shared_ptr<ChildPipe> Adopt(ChildAnswer* answer) = 0;
  // Called by the connection's destructor.
  virtual void Closed(Connection* connection) = 0;
};

class Connection : public std::enable_shared_from_this<Connection> {
 public:
  Connection(ConnectionHost* host, boost::asio::ip::tcp::socket socket);
  ~Connection();
  // Begins to read; the caller may let go of it then.
  void Start();
  // Ends it now when it is between requests; otherwise after the reply.
  void Stop();
  // What it is doing, and since when.
  enum class Stage { kIdle, kReading, kAnswering, kEnded };
  Stage stage() const { return stage_; }
  std::chrono::steady_clock::time_point since() const { return since_; }
  // What stands for its client in counts.
  const std::string& network() const { return network_; }

  // Ends it now, and kills the child that answers.
  void Abort();

 private:
  using Parser = boost::beast::http::request_parser<HeldBody>;
  using Error = boost::system::error_code;

  // What the socket does is cancelled, and timed_out_ set, after this long.
  void Arm(int seconds);
  void Enter(Stage stage);
  void AwaitRequest();
  void ReadHeader();
  void SetClient();
  void OnHeader(Error error);
  void ReadBody();
  void ReadPiece();
  void OnPiece(Error error);
  void OnReadError(Error error);
  void Dispatch();
  Answer HandleSafely();
  void ForgetBody();
  void Refuse(int status, const char* sentence);

  void Send(HttpReply reply);
  void SendNow(HttpReply reply);
  void AwaitChild(ChildAnswer answer);
  void OnChildBytes(std::string_view bytes);
  void OnChildHead(const nas::ReplyHead* head);
  void RefuseOldClient();
  void Relay();
  std::string HeadText(const HttpReply& reply, std::uint64_t length) const;

  // Writes `out_`, then calls `then`.
  void Write(void (Connection::*then)());
  void OnSent();
  void FinishRequest();
  void Linger();
  void Drop();

  ConnectionHost* host_;
  boost::asio::ip::tcp::socket socket_;
  boost::asio::steady_timer deadline_;  // for what the socket is doing
  bool timed_out_ = false;
  boost::asio::steady_timer delay_;  // of a reply that must not show how long it took
  boost::beast::flat_buffer in_;
  std::optional<Parser> parser_;
  std::string network_;
  std::string peer_;  // who is connected, which may be a proxy
  HttpRequest request_;
  Stage stage_ = Stage::kIdle;
  std::chrono::steady_clock::time_point since_ = Clock::now();
  bool keep_alive_ = false;

  std::shared_ptr<ChildPipe> child_;
  std::function<HttpReply(const nas::ReplyHead*)> make_reply_;
  std::optional<nas::ReplyReader> head_reader_;
  // Of what the child still has to send, or kUntilEnd.
  std::uint64_t body_left_ = 0;

  int status_ = 0;
  std::string out_;
  size_t out_at_ = 0;
  std::uint64_t sent_ = 0;
};

}  // namespace arbory

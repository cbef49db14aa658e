#pragma once
// A request's body as the network library's parser fills it: held only as far as there is room for
// it, and read to its end in any case, so that the connection can go on. Included only where the
// network library is.

#include <algorithm>
#include <boost/asio/buffer.hpp>
#include <boost/beast/core/buffers_range.hpp>
#include <boost/beast/http/message.hpp>
#include <boost/optional/optional.hpp>
#include <memory>
#include <string>

#include "arbory/server/transport/http.h"

namespace arbory {

struct HeldBody {
  struct value_type {
    std::shared_ptr<BodyRoom> room;  // null: nothing is held; set before the body is read
    std::string bytes;               // empty where there was no room
    std::uint64_t came = 0;

    void Append(std::string_view more, std::uint64_t announced) {
      came += more.size();
      if (!room) return;
      const std::uint64_t needed = bytes.size() + more.size();
      if (needed > taken_) {
        // Without a length the room grows as strings do, which is what it stands for.
        if (!Grow(std::max({needed, announced, 2 * taken_})) && !Grow(needed)) {
          std::string().swap(bytes);
          room.reset();
          return;
        }
      }
      bytes += more;
    }

   private:
    bool Grow(std::uint64_t wanted) {
      if (!room->Take(wanted - taken_)) return false;
      taken_ = wanted;
      bytes.reserve(wanted);
      return true;
    }

    std::uint64_t taken_ = 0;
  };

  class reader {
   public:
    template <bool is_request, class Fields>
    reader(boost::beast::http::header<is_request, Fields>& /*head*/, value_type& body)
        : body_(body) {}

    void init(const boost::optional<std::uint64_t>& length, boost::system::error_code& error) {
      announced_ = length.value_or(0);
      error = {};
    }
    template <class Buffers>
    size_t put(const Buffers& buffers, boost::system::error_code& error) {
      size_t count = 0;
      for (const boost::asio::const_buffer piece : boost::beast::buffers_range_ref(buffers)) {
        body_.Append({static_cast<const char*>(piece.data()), piece.size()}, announced_);
        count += piece.size();
      }
      error = {};
      return count;
    }
    void finish(boost::system::error_code& error) { error = {}; }

   private:
    value_type& body_;
    std::uint64_t announced_ = 0;
  };
};

}  // namespace arbory

#pragma once
// Replies compressed for slow lines. Text alone: listings are a tenth of their size. Which replies
// are, is decided where they are made, as a compressed reply shows by its length how much its parts
// have in common: none that holds a secret of the session is compressed, and what a client sent
// comes back only to the page that sent it, since no other site's request carries the cookie.

#include "arbory/server/transport/http.h"
#include "nas/system/child.h"

namespace arbory {

// Whether `Accept-Encoding` names gzip, with a weight that is not zero.
bool TakesGzip(const HttpRequest& request);

// The reply compressed and saying so; as it is where it is too short to gain, or so long that the
// compressing would be felt. For a child: it takes milliseconds.
nas::Reply Gzipped(nas::Reply reply);

}  // namespace arbory

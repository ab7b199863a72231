// The request token that a client sends with `ns_time`, computed here on its own so that
// `--check-token` checks the client's computation rather than repeating it.
#pragma once

#include <string>

namespace store {

// Lower-case hexadecimal MD5 of `text`.
std::string md5Hex(const std::string& text);

// The token for the time text: h = md5(time); 1 + (first hex digit of h) rounds of
// w = md5(w + md5(w)), starting from w = time.
std::string expectedToken(const std::string& nsTime);

}  // namespace store

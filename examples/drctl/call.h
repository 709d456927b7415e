// A web API handler: one call document in, one reply document out.

#ifndef DRCTL_CALL_H_
#define DRCTL_CALL_H_

#include "commands.h"

namespace drctl {

// Reads a call from options.callFile or standard input and writes the reply to standard output;
// with options.cgi as a CGI program (RFC 3875), with the call in the body of a POST. The exit
// status is 0 for a successful call, and for every reply of a CGI program.
int Call(const Options& options);

}  // namespace drctl

#endif  // DRCTL_CALL_H_

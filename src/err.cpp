#include "kelodrcore/err.h"

namespace KeloDRCore::ERR {
namespace {

const char* NameOf(int code) {
  switch (code) {
    case ERR_DR_MIN:
      return "ERR_DR_MIN";
    case BAD_PARAMETER:
      return "BAD_PARAMETER";
    case ERR_ALLOCATE_MEMORY:
      return "ERR_ALLOCATE_MEMORY";
    case ERR_NULL_POINTER:
      return "ERR_NULL_POINTER";
    case ERR_DATABASE_OPERATION:
      return "ERR_DATABASE_OPERATION";
    case ERR_DATABASE_LOCK:
      return "ERR_DATABASE_LOCK";
    case ERR_FORK_FAILED:
      return "ERR_FORK_FAILED";
    case ERR_UNKNOWN:
      return "ERR_UNKNOWN";
    case ERR_CONNECTION_FAILED:
      return "ERR_CONNECTION_FAILED";
    case ERR_LOGIN_AUTH_INVALID:
      return "ERR_LOGIN_AUTH_INVALID";
    case ERR_LOGIN_AUTH_DISABLED:
      return "ERR_LOGIN_AUTH_DISABLED";
    case ERR_LOGIN_AUTH_PRIVILEGE:
      return "ERR_LOGIN_AUTH_PRIVILEGE";
    case ERR_LOGIN_AUTH_REQUIRED_OTP:
      return "ERR_LOGIN_AUTH_REQUIRED_OTP";
    case ERR_LOGIN_AUTH_INVALID_OTP:
      return "ERR_LOGIN_AUTH_INVALID_OTP";
    case ERR_INIT_CREDENTIAL:
      return "ERR_INIT_CREDENTIAL";
    case ERR_NODE_NOT_EXIST:
      return "ERR_NODE_NOT_EXIST";
    case ERR_NODE_EXIST:
      return "ERR_NODE_EXIST";
    case ERR_NODE_INVALID_REMOTE_SESSION_CREATE:
      return "ERR_NODE_INVALID_REMOTE_SESSION_CREATE";
    case ERR_NODE_CREATE:
      return "ERR_NODE_CREATE";
    case ERR_NODE_SESSION_CREATE:
      return "ERR_NODE_SESSION_CREATE";
    case ERR_NODE_SESSION_REMOVE:
      return "ERR_NODE_SESSION_REMOVE";
    case ERR_NODE_GET:
      return "ERR_NODE_GET";
    case ERR_NODE_SET:
      return "ERR_NODE_SET";
    case ERR_NODE_LIST:
      return "ERR_NODE_LIST";
    case ERR_CRED_NOT_EXIST:
      return "ERR_CRED_NOT_EXIST";
    case ERR_INVALID_CONN:
      return "ERR_INVALID_CONN";
    case ERR_NOT_SAME_NODE:
      return "ERR_NOT_SAME_NODE";
    case ERR_GET_NODE_INFO:
      return "ERR_GET_NODE_INFO";
    case ERR_INVALID_SENDER:
      return "ERR_INVALID_SENDER";
    case ERR_INVALID_SESSION:
      return "ERR_INVALID_SESSION";
    case ERR_NOT_AVALIABLE_CONN:
      return "ERR_NOT_AVALIABLE_CONN";
    case ERR_LOGIN_AUTH:
      return "ERR_LOGIN_AUTH";
    case ERR_CREDENTIAL_OPERATION:
      return "ERR_CREDENTIAL_OPERATION";
    case ERR_NO_PERMISSION:
      return "ERR_NO_PERMISSION";
    case ERR_NO_SUCH_API:
      return "ERR_NO_SUCH_API";
    case ERR_INVALID_USER:
      return "ERR_INVALID_USER";
    case ERR_SESSION_GET:
      return "ERR_SESSION_GET";
    case ERR_NODE_UNKNOWN:
      return "ERR_NODE_UNKNOWN";
    case ERR_DR_MAX:
      return "ERR_DR_MAX";
    default:
      return "<UNKNOWN ERR CODE>";
  }
}

}  // namespace

std::string ToString(int code) { return NameOf(code); }

}  // namespace KeloDRCore::ERR

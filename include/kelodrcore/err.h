/// @file
/// The package's error codes and their names.

#ifndef KELODRCORE_ERR_H_
#define KELODRCORE_ERR_H_

#include <string>

#include "kelodrcore/export.h"

/// Error codes: 400 to 407 are failures inside this library, 500 to 599 belong to the
/// disaster-recovery service built on it. 0 means success throughout and has no name. Codes and
/// names leave the process in error documents and logs: they never change.
namespace KeloDRCore::ERR {

/// The codes, each an `int` constant of this namespace.
enum Code : int {
  ERR_DR_MIN = 400,     ///< lower bound of the range, not an error
  BAD_PARAMETER = 401,  ///< bad argument: empty statement, invalid command, empty delete condition
  ERR_ALLOCATE_MEMORY = 402,     ///< memory allocation failed
  ERR_NULL_POINTER = 403,        ///< missing object: no connection after a successful open
  ERR_DATABASE_OPERATION = 404,  ///< a database operation failed
  ERR_DATABASE_LOCK = 405,       ///< the database stayed busy or locked
  ERR_FORK_FAILED = 406,         ///< a child process could not be started
  ERR_UNKNOWN = 407,  ///< unknown failure; also the provisional code while a statement runs
  ERR_CONNECTION_FAILED = 500,        ///< no connection to the service
  ERR_LOGIN_AUTH_INVALID = 501,       ///< login: wrong account or password
  ERR_LOGIN_AUTH_DISABLED = 502,      ///< login: the account is disabled
  ERR_LOGIN_AUTH_PRIVILEGE = 503,     ///< login: the account lacks the privilege
  ERR_LOGIN_AUTH_REQUIRED_OTP = 504,  ///< login: a one-time password is required
  ERR_LOGIN_AUTH_INVALID_OTP = 505,   ///< login: wrong one-time password
  ERR_INIT_CREDENTIAL = 506,          ///< a credential could not be set up
  ERR_NODE_NOT_EXIST = 507,           ///< no such node
  ERR_NODE_EXIST = 508,               ///< the node exists already
  ERR_NODE_INVALID_REMOTE_SESSION_CREATE =
      509,                         ///< a session on the remote side could not be created
  ERR_NODE_CREATE = 510,           ///< a node could not be created
  ERR_NODE_SESSION_CREATE = 511,   ///< a session of a node could not be created
  ERR_NODE_SESSION_REMOVE = 512,   ///< a session of a node could not be removed
  ERR_NODE_GET = 513,              ///< a node could not be read
  ERR_NODE_SET = 514,              ///< a node could not be changed
  ERR_NODE_LIST = 515,             ///< the nodes could not be listed
  ERR_CRED_NOT_EXIST = 516,        ///< no such credential
  ERR_INVALID_CONN = 517,          ///< invalid connection
  ERR_NOT_SAME_NODE = 518,         ///< not the same node
  ERR_GET_NODE_INFO = 519,         ///< information on a node could not be read
  ERR_INVALID_SENDER = 520,        ///< invalid sender
  ERR_INVALID_SESSION = 521,       ///< invalid session
  ERR_NOT_AVALIABLE_CONN = 522,    ///< no usable connection (the spelling is the interface's)
  ERR_LOGIN_AUTH = 523,            ///< login failed
  ERR_CREDENTIAL_OPERATION = 524,  ///< an operation on a credential failed
  ERR_NO_PERMISSION = 525,         ///< no permission
  ERR_NO_SUCH_API = 526,           ///< no such API or method
  ERR_INVALID_USER = 527,          ///< invalid user
  ERR_SESSION_GET = 528,           ///< a session could not be read
  ERR_NODE_UNKNOWN = 599,          ///< unknown failure of a node
  ERR_DR_MAX = 673,                ///< upper bound of the range, not an error
};

/// The name of `code`, for logs and messages, as the enumeration spells it; "<UNKNOWN ERR CODE>"
/// for any other number.
[[nodiscard]] KELODR_EXPORT std::string ToString(int code);

}  // namespace KeloDRCore::ERR

#endif  // KELODRCORE_ERR_H_

/// @file
/// The package's error codes and their names.

#ifndef KELODRCORE_ERR_H_
#define KELODRCORE_ERR_H_

#include <string>

#include "kelodrcore/export.h"

/// Error codes: 400 to 407 are failures inside this library, 500 to 599 belong to the
/// disaster-recovery service that is built on it. 0 means success everywhere and has no name.
///
/// Codes and names leave the process in error documents and logs and never change. Two spellings
/// are deliberate: `BAD_PARAMETER` and `ERR_NOT_AVALIABLE_CONN`.
namespace KeloDRCore::ERR {

/// The codes.
/// @{
inline constexpr int ERR_DR_MIN = 400;              ///< lower bound of the range, not an error
inline constexpr int BAD_PARAMETER = 401;           ///< bad argument, such as an empty statement
inline constexpr int ERR_ALLOCATE_MEMORY = 402;     ///< memory allocation failed
inline constexpr int ERR_NULL_POINTER = 403;        ///< no connection after a successful open
inline constexpr int ERR_DATABASE_OPERATION = 404;  ///< a database operation failed
inline constexpr int ERR_DATABASE_LOCK = 405;       ///< the database stayed busy or locked
inline constexpr int ERR_FORK_FAILED = 406;         ///< a child process could not be started
inline constexpr int ERR_UNKNOWN = 407;            ///< unknown failure; also while a statement runs
inline constexpr int ERR_CONNECTION_FAILED = 500;  ///< no connection to the service
inline constexpr int ERR_LOGIN_AUTH_INVALID = 501;       ///< login: wrong account or password
inline constexpr int ERR_LOGIN_AUTH_DISABLED = 502;      ///< login: the account is disabled
inline constexpr int ERR_LOGIN_AUTH_PRIVILEGE = 503;     ///< login: the account lacks the privilege
inline constexpr int ERR_LOGIN_AUTH_REQUIRED_OTP = 504;  ///< login: a one-time password is required
inline constexpr int ERR_LOGIN_AUTH_INVALID_OTP = 505;   ///< login: wrong one-time password
inline constexpr int ERR_INIT_CREDENTIAL = 506;          ///< a credential could not be set up
inline constexpr int ERR_NODE_NOT_EXIST = 507;           ///< no such node
inline constexpr int ERR_NODE_EXIST = 508;               ///< the node exists already
inline constexpr int ERR_NODE_INVALID_REMOTE_SESSION_CREATE = 509;  ///< no remote session
inline constexpr int ERR_NODE_CREATE = 510;                         ///< a node could not be created
inline constexpr int ERR_NODE_SESSION_CREATE = 511;   ///< a session of a node could not be created
inline constexpr int ERR_NODE_SESSION_REMOVE = 512;   ///< a session of a node could not be removed
inline constexpr int ERR_NODE_GET = 513;              ///< a node could not be read
inline constexpr int ERR_NODE_SET = 514;              ///< a node could not be changed
inline constexpr int ERR_NODE_LIST = 515;             ///< the nodes could not be listed
inline constexpr int ERR_CRED_NOT_EXIST = 516;        ///< no such credential
inline constexpr int ERR_INVALID_CONN = 517;          ///< invalid connection
inline constexpr int ERR_NOT_SAME_NODE = 518;         ///< not the same node
inline constexpr int ERR_GET_NODE_INFO = 519;         ///< information on a node could not be read
inline constexpr int ERR_INVALID_SENDER = 520;        ///< invalid sender
inline constexpr int ERR_INVALID_SESSION = 521;       ///< invalid session
inline constexpr int ERR_NOT_AVALIABLE_CONN = 522;    ///< no usable connection
inline constexpr int ERR_LOGIN_AUTH = 523;            ///< login failed
inline constexpr int ERR_CREDENTIAL_OPERATION = 524;  ///< an operation on a credential failed
inline constexpr int ERR_NO_PERMISSION = 525;         ///< no permission
inline constexpr int ERR_NO_SUCH_API = 526;           ///< no such API or method
inline constexpr int ERR_INVALID_USER = 527;          ///< invalid user
inline constexpr int ERR_SESSION_GET = 528;           ///< a session could not be read
inline constexpr int ERR_NODE_UNKNOWN = 599;          ///< unknown failure of a node
inline constexpr int ERR_DR_MAX = 673;                ///< upper bound of the range, not an error
/// @}

/// The name of `code` as it is written above, for logs and messages. "<UNKNOWN ERR CODE>" for any
/// other number.
[[nodiscard]] KELODR_EXPORT std::string ToString(int code);

}  // namespace KeloDRCore::ERR

#endif  // KELODRCORE_ERR_H_

/// @file
/// The envelope of one call to the package's web API.
///
/// Deliberate, and frozen because callers rely on it: `clear` keeps the encryption flag.

#ifndef KELODRCORE_REQUEST_H_
#define KELODRCORE_REQUEST_H_

#include <json/json.h>

#include <string>

#include "kelodrcore/export.h"

namespace KeloDRCore {

/// The file that goes with a call. The library stores and copies the two texts and never opens the
/// file.
struct UploadFileDescription {
  std::string path;  ///< the local file
  std::string name;  ///< its name on the server
};

/// One call: API, method, version and parameters, and the settings of the client that sends it. The
/// class carries and checks a call; the caller sends it.
///
/// In the JSON form of a call, "api", "method" and "version" stand beside the parameters in one
/// object. These three keys are reserved and cannot be added as parameters.
///
/// Nothing here logs. An argument may be part of the request's own parameters: its value at the
/// time of the call counts.
class KELODR_EXPORT Request {
 public:
  /// No API, no method, version -1, null parameters, a time-out of 120 seconds, encryption not
  /// required, no file.
  Request();

  /// A call of these four parts; the rest is as by default. `newParams` is copied as it is:
  /// reserved keys in it are kept, and `toJson` overwrites them.
  Request(const std::string& newApi, int newVersion, const std::string& newMethod,
          const Json::Value& newParams);

  /// The defaults, then `setRequest(request)`. Implicit: a JSON call can stand for a `Request`.
  Request(const Json::Value& request);  // NOLINT(google-explicit-constructor)

  virtual ~Request();

  /// Sets one field, unchecked: `isValid` is the check.
  /// @{
  void setAPI(const std::string& newApi);
  void setMethod(const std::string& newMethod);
  void setVersion(int newVersion);
  void setTimeout(int newTimeout);  ///< in seconds
  void setEncryptRequired(bool newEncryptRequired);
  void setUploadFile(const UploadFileDescription& newUploadFile);
  /// @}

  /// The fields. A reference is valid until its field is next changed.
  /// @{
  [[nodiscard]] const std::string& getAPI() const { return api; }
  [[nodiscard]] const std::string& getMethod() const { return method; }
  [[nodiscard]] int getVersion() const { return version; }
  [[nodiscard]] int getTimeout() const { return timeout; }  ///< in seconds
  [[nodiscard]] bool isEncryptRequired() const { return encryptRequired; }
  [[nodiscard]] const UploadFileDescription& getUploadFile() const { return uploadFile; }
  [[nodiscard]] const Json::Value& getParams() const { return params; }
  /// @}

  /// True when the call can be sent: it has an API, a method and a version of at least 1. Nothing
  /// else is checked.
  [[nodiscard]] bool isValid() const;

  /// False for exactly "api", "method" and "version". Case counts; the empty key is valid.
  [[nodiscard]] static bool isValidKey(const std::string& key);

  /// Sets the parameter `key` to a copy of `value`; an earlier one is replaced. False for a
  /// reserved key, and when the parameters are neither null nor an object; nothing changes then.
  bool addParam(const std::string& key, const Json::Value& value);

  /// Sets a parameter for each member of `members`; the keys of an array are "0", "1" and so on.
  /// Reserved keys are skipped. False when there is a parameter to set and the parameters are
  /// neither null nor an object; nothing changes then. A value without members gives true.
  bool addParam(const Json::Value& members);

  /// Loads a call in its JSON form. The parameters become a copy of `request`. Then "api" and
  /// "method" move from the parameters to their fields when they are strings, and "version" when it
  /// passes `Json::Value::isInt`. A member of another type stays a parameter. A field without such
  /// a member keeps its value; so do the time-out, the encryption flag and the file. A `request`
  /// that is not an object changes the parameters only.
  void setRequest(const Json::Value& request);

  /// The JSON form: the parameters with "api", "method" and "version" set. Parameters that are
  /// neither null nor an object are left out, and so are the time-out, the encryption flag and the
  /// file.
  [[nodiscard]] Json::Value toJson() const;

  /// "API/METHOD/VERSION", the short name for log lines.
  [[nodiscard]] std::string toStr() const;

  /// Sets the fields to their defaults, except for two: the encryption flag stays, and parameters
  /// that are an object or an array are emptied.
  void clear();

 private:
  static constexpr int kNoVersion = -1;
  static constexpr int kDefaultTimeout = 120;

  int version = kNoVersion;
  int timeout = kDefaultTimeout;
  std::string api;
  std::string method;
  Json::Value params;
  bool encryptRequired = false;
  UploadFileDescription uploadFile;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_REQUEST_H_

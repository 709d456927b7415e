/// @file
/// The envelope of one call to the package's web API.

#ifndef KELODRCORE_REQUEST_H_
#define KELODRCORE_REQUEST_H_

#include <json/json.h>

#include <string>

#include "kelodrcore/export.h"

namespace KeloDRCore {

/// The file that goes with a call. The library stores and copies the texts, and never opens the
/// file.
struct UploadFileDescription {
  std::string path;  ///< the local file
  std::string name;  ///< its name on the server
};

/// One call: API, method, version and parameters, and the settings of the client that sends it.
/// Sending it is the caller's business.
///
/// In the JSON form of a call, "api", "method" and "version" stand beside the parameters in one
/// object; these three keys are reserved and cannot be added as parameters.
///
/// Nothing here logs or throws on its own account. An argument may be part of the request's own
/// parameters: what counts is its value at the time of the call.
class KELODR_EXPORT Request {
 public:
  /// No API, no method, version -1, null parameters, a time-out of 120 seconds, encryption not
  /// required, no file.
  Request();

  /// A call with the given four parts, the rest as by default. `parameters` is copied as it is:
  /// reserved keys in it are kept, and toJson() overwrites them.
  Request(const std::string& apiName, int apiVersion, const std::string& methodName,
          const Json::Value& parameters);

  /// The defaults, then setRequest(`request`). Implicit: a JSON call goes wherever a Request does.
  /// A document that is given away becomes the parameters without being copied, and is null
  /// afterwards.
  /// @{
  Request(const Json::Value& request);  // NOLINT(google-explicit-constructor)
  Request(Json::Value&& request);       // NOLINT(google-explicit-constructor)
  /// @}

  virtual ~Request();

  /// Sets one field, unchecked; isValid() is the check.
  /// @{
  void setAPI(const std::string& value);
  void setMethod(const std::string& value);
  void setVersion(int value);
  void setTimeout(int seconds);
  void setEncryptRequired(bool required);
  void setUploadFile(const UploadFileDescription& file);
  /// @}

  /// The fields as they are. References are valid until the field is next changed.
  /// @{
  [[nodiscard]] const std::string& getAPI() const { return api; }
  [[nodiscard]] const std::string& getMethod() const { return method; }
  [[nodiscard]] int getVersion() const { return version; }
  [[nodiscard]] int getTimeout() const { return timeout; }  ///< in seconds
  [[nodiscard]] bool isEncryptRequired() const { return encryptRequired; }
  [[nodiscard]] const UploadFileDescription& getUploadFile() const { return uploadFile; }
  [[nodiscard]] const Json::Value& getParams() const { return params; }
  /// @}

  /// Whether the call can be sent: an API, a method, and a version of at least 1. Nothing else is
  /// looked at.
  [[nodiscard]] bool isValid() const;

  /// False for exactly "api", "method" and "version" (case-sensitive); the empty key is valid.
  [[nodiscard]] static bool isValidKey(const std::string& key);

  /// Sets the parameter `key` to `value`, replacing an earlier one. Changes nothing and returns
  /// false for a reserved key, and when the parameters are neither null nor an object. A value that
  /// is given away is not copied, and is null afterwards if the result is true.
  /// @{
  bool addParam(const std::string& key, const Json::Value& value);
  bool addParam(const std::string& key, Json::Value&& value);
  /// @}

  /// Sets a parameter for every member of the object `members`, but for reserved keys, which are
  /// skipped silently. Anything but an object has no members: nothing changes and the result is
  /// true. When the parameters are neither null nor an object, nothing changes and the result is
  /// false, whatever `members` is.
  bool addParam(const Json::Value& members);

  /// Loads a call in its JSON form. The parameters become a copy of `request`; "api" and "method"
  /// then move from them to their fields if they are strings, and "version" if it passes
  /// Json::Value::isInt(). A member of another type, or a missing one, leaves the field as it was
  /// (the former stays among the parameters). No field is taken from a `request` that is not an
  /// object. The time-out, the encryption flag and the file are not touched.
  void setRequest(const Json::Value& request);

  /// The JSON form: the parameters with "api", "method" and "version" set. Parameters that are
  /// neither null nor an object are left out. The time-out, the encryption flag and the file are
  /// not part of it.
  [[nodiscard]] Json::Value toJson() const;

  /// The same for a request that is done with: its parameters are not copied, and null afterwards.
  /// Everything else stays.
  [[nodiscard]] Json::Value takeJson();

  /// "API/METHOD/VERSION", the short name for log lines.
  [[nodiscard]] std::string toStr() const;

  /// Back to the defaults, with two exceptions: the encryption flag deliberately stays, and
  /// parameters that were an object become an empty object (anything else becomes null).
  void clear();

 private:
  // Moves the three reserved members out of the parameters.
  KELODR_LOCAL void takeEnvelope();
  KELODR_LOCAL Json::Value makeJson(Json::Value members) const;

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

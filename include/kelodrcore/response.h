/// @file
/// The reply to one call of the package's web API.

#ifndef KELODRCORE_RESPONSE_H_
#define KELODRCORE_RESPONSE_H_

#include <json/json.h>

#include <string>

#include "kelodrcore/export.h"

namespace KeloDRCore {

/// A JSON reply, and the questions that a client asks of it: success, error code and details, data,
/// and the state of a background task. Polling a task is repeating the call until isPollFinish(),
/// then asking isPollSuccess(); nothing of the polling is kept here.
///
/// The members that are read, all of them optional:
///
///     {"success": BOOL,
///      "data": {"finish": BOOL, "success": BOOL, "task_id": TEXT, "additional": ANY, ...},
///      "error": {"code": INT, "errors": ANY}}
///
/// A reply, "data" or "error" that is not an object has no members; `"data": null` is a member that
/// is there. Each query builds on the one before it: isValid() gates isSuccess(), which gates
/// hasData(), which gates everything inside "data", so that a failed reply has no data even when it
/// carries "data". The error queries do not depend on "data".
///
/// Nothing here logs or throws on its own account; an absent member gives false, -1, the empty text
/// or a null value. But "success", "finish" and "task_id" are converted without a look at their
/// type: Json::LogicError passes through where JsonCpp cannot convert it. Every query that builds
/// on isSuccess() can meet this: "success" must not be a text, an array or an object.
///
/// References that queries return are valid until the document is next set or cleared, or the
/// object is destroyed. An argument may be part of the object's own document: what counts is its
/// value at the time of the call.
class KELODR_EXPORT Response {
 public:
  /// A null document.
  Response();

  /// @{
  /// A copy of the other's document.
  Response(const Response& other);
  Response& operator=(const Response& other);
  /// @}

  /// The document that `text` holds; a null one when it does not parse, which a null pointer never
  /// does. Implicit: a reply goes wherever a Response does. Use setResp() to learn whether it
  /// parsed.
  /// @{
  Response(const std::string& text);  // NOLINT(google-explicit-constructor)
  Response(const char* text);         // NOLINT(google-explicit-constructor)
  /// @}

  /// A copy of `document`. Implicit for the same reason.
  Response(const Json::Value& document);  // NOLINT(google-explicit-constructor)

  /// Any other pointer would turn into a JSON true.
  template <typename T>
  Response(const T* pointer) = delete;  // NOLINT(google-explicit-constructor)

  virtual ~Response();

  /// Replaces the document with the one that `text` holds. False, with the document unchanged, when
  /// it does not parse, which a null pointer never does.
  /// @{
  bool setResp(const std::string& text);
  bool setResp(const char* text);
  /// @}

  /// Replaces the document with a copy of `document`.
  void setResp(const Json::Value& document);

  /// Any other pointer would turn into a JSON true.
  template <typename T>
  void setResp(const T* pointer) = delete;

  /// Makes an object an empty object, and anything else null.
  void clear();

  /// The document is an object with the member "success".
  bool isValid() const;

  /// The reply is valid and its "success" converts to true.
  /// @throws Json::LogicError "success" is a text, an array or an object; likewise all below that
  ///     ask isSuccess() first.
  bool isSuccess() const;

  /// 0 for a successful reply, whatever its "error" holds; otherwise the int "error" / "code" of a
  /// valid reply; -1 when there is none or it does not pass Json::Value::isInt().
  int getErrCode() const;

  /// A copy of "error" / "errors" of a valid reply, null when there is none. Deliberately also for
  /// a successful reply that carries it.
  Json::Value getErrMsg() const;

  /// A copy of "error", null when there is none; the reply need not be valid.
  Json::Value getErr() const;

  /// The reply is successful and has "data".
  bool hasData() const;

  /// "data" when hasData(), otherwise a null value.
  const Json::Value& getData() const;

  /// The reply hasData() with a member `name`; false for a null pointer.
  bool hasDataField(const char* name) const;

  /// "data" / `name` when hasDataField(), otherwise a null value.
  const Json::Value& getDataField(const char* name) const;

  /// The text of "data" / `name`; empty when there is none or it is not a string: numbers and bools
  /// are deliberately not converted.
  std::string getDataFieldtoStr(const char* name) const;

  /// The background task has ended: "data" / "finish" is there and converts to true.
  /// @throws Json::LogicError also when "finish" is a text, an array or an object
  bool isPollFinish() const;

  /// The background task has ended well: "data" / "success" (not the reply's own "success") is
  /// there and converts to true.
  /// @throws Json::LogicError also when it is a text, an array or an object
  bool isPollSuccess() const;

  /// The id of the background task, "data" / "task_id" converted to text; empty when there is none.
  /// @throws Json::LogicError also when "task_id" is an array or an object
  std::string getTaskId() const;

  /// hasDataField("additional") and getDataField("additional"): further result data.
  /// @{
  bool hasAdditional() const;
  const Json::Value& getAdditional() const;
  /// @}

  /// The document has the top-level member `name`; it need not be valid. False for a null pointer.
  bool hasField(const char* name) const;

  /// The top-level member `name` when hasField(), otherwise a null value.
  const Json::Value& getField(const char* name) const;

 private:
  KELODR_LOCAL const Json::Value& orNull(const Json::Value* member) const;

  const Json::Value nullValue;
  Json::Value resp;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_RESPONSE_H_

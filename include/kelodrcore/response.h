/// @file
/// The reply to one call of the package's web API.
///
/// Deliberate, and frozen because callers rely on it: a failed reply has no data even when it
/// carries "data", a successful one keeps its error details, and `getDataFieldtoStr` (whose
/// spelling is fixed) converts nothing.

#ifndef KELODRCORE_RESPONSE_H_
#define KELODRCORE_RESPONSE_H_

#include <json/json.h>

#include <string>

#include "kelodrcore/export.h"

namespace KeloDRCore {

/// A JSON reply, and the questions that a client asks of it: success, error code and details, data,
/// and the state of a background task. A client that polls a task repeats the call until
/// `isPollFinish` is true and then asks `isPollSuccess`; nothing of the polling is kept here.
///
/// The members that are read, all of them optional:
///
///     {"success": BOOL,
///      "data": {"finish": BOOL, "success": BOOL, "task_id": TEXT, "additional": ANY, ...},
///      "error": {"code": INT, "errors": ANY}}
///
/// A reply, "data" or "error" that is not an object has no members; `"data": null` is a member that
/// is there. Each query needs the one before it: `isValid`, `isSuccess`, `hasData`, and everything
/// inside "data". The error queries do not need "data".
///
/// Nothing here logs. An absent member gives false, -1, the empty text or a null value. "success",
/// "finish" and "task_id" are converted without a look at their type. Throws `Json::LogicError`
/// where JsonCpp cannot convert one: a "success" or "finish" that is a text, an array or an object,
/// and a "task_id" that is an array or an object. Every query that needs `isSuccess` reads
/// "success".
///
/// A reference that a query returns is valid until the document is next set or cleared, or the
/// object is destroyed. An argument may be part of the object's own document: its value at the time
/// of the call counts.
class KELODR_EXPORT Response {
 public:
  /// A null document.
  Response();

  /// A copy of the other's document.
  /// @{
  Response(const Response& other);
  Response& operator=(const Response& other);
  /// @}

  /// The document that `text` holds, or a null one when `text` is null or does not parse (`setResp`
  /// tells which). Implicit: a reply's text can stand for a `Response`.
  /// @{
  Response(const std::string& text);  // NOLINT(google-explicit-constructor)
  Response(const char* text);         // NOLINT(google-explicit-constructor)
  /// @}

  /// A copy of `document`. Implicit: a document can stand for a `Response`.
  Response(const Json::Value& document);  // NOLINT(google-explicit-constructor)

  /// Any other pointer would turn into a JSON true.
  template <typename T>
  Response(const T* pointer) = delete;  // NOLINT(google-explicit-constructor)

  virtual ~Response();

  /// Replaces the document with the one that `text` holds. False when `text` is null or does not
  /// parse; the document is then unchanged.
  /// @{
  bool setResp(const std::string& text);
  bool setResp(const char* text);
  /// @}

  /// Replaces the document with a copy of `document`.
  void setResp(const Json::Value& document);

  /// Any other pointer would turn into a JSON true.
  template <typename T>
  void setResp(const T* pointer) = delete;

  /// Empties an object or an array, and makes anything else null.
  void clear();

  /// True when the document is an object with the member "success".
  bool isValid() const;

  /// True when the reply is valid and its "success" converts to true.
  bool isSuccess() const;

  /// 0 for a successful reply, whatever its "error" holds. Otherwise the int "error" / "code" of a
  /// valid reply; -1 when there is none or it does not pass `Json::Value::isInt`.
  int getErrCode() const;

  /// A copy of "error" / "errors" of a valid reply, a successful one too; null when there is none.
  Json::Value getErrMsg() const;

  /// A copy of "error", null when there is none; the reply need not be valid.
  Json::Value getErr() const;

  /// True when the reply is successful and has "data".
  bool hasData() const;

  /// "data" when `hasData`, otherwise a null value.
  const Json::Value& getData() const;

  /// True when the reply has data with a member `name`; false for a null pointer.
  bool hasDataField(const char* name) const;

  /// "data" / `name` when `hasDataField`, otherwise a null value.
  const Json::Value& getDataField(const char* name) const;

  /// The text of "data" / `name`; empty when there is none or it is not a string.
  std::string getDataFieldtoStr(const char* name) const;

  /// True when the background task has ended: "data" / "finish" is there and converts to true.
  bool isPollFinish() const;

  /// True when the background task has ended well: "data" / "success" (not the reply's own
  /// "success") is there and converts to true.
  bool isPollSuccess() const;

  /// The id of the background task: "data" / "task_id" converted to text, empty when there is none.
  std::string getTaskId() const;

  /// `hasDataField("additional")` and `getDataField("additional")`: further result data.
  /// @{
  bool hasAdditional() const;
  const Json::Value& getAdditional() const;
  /// @}

  /// True when the document has the top-level member `name`; the reply need not be valid. False for
  /// a null pointer.
  bool hasField(const char* name) const;

  /// The top-level member `name` when `hasField`, otherwise a null value.
  const Json::Value& getField(const char* name) const;

 private:
  KELODR_LOCAL const Json::Value& orNull(const Json::Value* member) const;

  const Json::Value nullValue;
  Json::Value resp;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_RESPONSE_H_

// Calls and replies of the web API.

#ifndef KELODRCORE_TESTS_MODEL_WEB_H_
#define KELODRCORE_TESTS_MODEL_WEB_H_

#include <string>
#include <vector>

#include "kelodrcore/request.h"
#include "kelodrcore/response.h"
#include "model/twin.h"

namespace Model {

class Request {
 public:
  Request() = default;
  Request(const std::string& newApi, int newVersion, const std::string& newMethod,
          const Json::Value& newParams)
      : version(newVersion), api(newApi), method(newMethod), params(newParams) {}
  Request(const Json::Value& request) { setRequest(request); }

  void setAPI(const std::string& value) { api = value; }
  void setMethod(const std::string& value) { method = value; }
  void setVersion(int value) { version = value; }
  void setTimeout(int value) { timeout = value; }
  void setEncryptRequired(bool value) { isEncrypted = value; }
  void setUploadFile(const KeloDRCore::UploadFileDescription& value) { file = value; }

  const std::string& getAPI() const { return api; }
  const std::string& getMethod() const { return method; }
  int getVersion() const { return version; }
  int getTimeout() const { return timeout; }
  bool isEncryptRequired() const { return isEncrypted; }
  const KeloDRCore::UploadFileDescription& getUploadFile() const { return file; }
  const Json::Value& getParams() const { return params; }

  bool isValid() const { return !api.empty() && !method.empty() && version >= 1; }
  static bool isValidKey(const std::string& key) {
    return key != "api" && key != "method" && key != "version";
  }

  bool addParam(const std::string& key, const Json::Value& value) {
    if (!isValidKey(key) || !HasMembers(params)) return false;
    params[key] = Json::Value(value);  // may be a part of the parameters
    return true;
  }
  bool addParam(const Json::Value& members) {
    if (members.isArray()) {
      Json::Value object = Json::objectValue;
      for (Json::ArrayIndex i = 0; i < members.size(); ++i) object[std::to_string(i)] = members[i];
      return addParam(object);
    }
    if (!members.isObject()) return true;
    for (const std::string& key : members.getMemberNames()) {
      if (isValidKey(key) && !addParam(key, members[key])) return false;
    }
    return true;
  }

  void setRequest(const Json::Value& request) {
    params = Json::Value(request);
    if (!params.isObject()) return;
    if (params.isMember("api") && params["api"].isString()) api = Taken("api").asString();
    if (params.isMember("method") && params["method"].isString()) {
      method = Taken("method").asString();
    }
    if (params.isMember("version") && params["version"].isInt()) version = Taken("version").asInt();
  }

  Json::Value toJson() const {
    Json::Value document = HasMembers(params) ? params : Json::Value();
    document["api"] = api;
    document["method"] = method;
    document["version"] = version;
    return document;
  }
  std::string toStr() const { return api + "/" + method + "/" + std::to_string(version); }

  void clear() {
    version = -1;
    timeout = 120;
    api = method = file.path = file.name = "";
    params = Json::Value(params.isObject() || params.isArray() ? params.type() : Json::nullValue);
  }

 private:
  static bool HasMembers(const Json::Value& value) { return value.isNull() || value.isObject(); }
  Json::Value Taken(const char* key) {
    const Json::Value member = params[key];
    params.removeMember(key);
    return member;
  }

  int version = -1;
  int timeout = 120;
  std::string api;
  std::string method;
  Json::Value params;
  bool isEncrypted = false;
  KeloDRCore::UploadFileDescription file;
};

// A text and what it holds, if it is a document.
struct DocumentText {
  std::string text;
  Json::Value document;
  bool isDocument;
};

class Response {
 public:
  Response() = default;
  Response(const DocumentText& text) { setResp(text); }
  Response(const Json::Value& document) : resp(document) {}

  bool setResp(const DocumentText& text) {
    if (text.isDocument) resp = text.document;
    return text.isDocument;
  }
  void setResp(const Json::Value& document) { resp = document; }
  void clear() {
    resp = Json::Value(resp.isObject() || resp.isArray() ? resp.type() : Json::nullValue);
  }

  bool isValid() const { return Has(resp, "success"); }
  bool isSuccess() const { return isValid() && resp["success"].asBool(); }
  int getErrCode() const {
    if (isSuccess()) return 0;
    const bool hasCode = isValid() && Has(resp, "error") && Has(resp["error"], "code");
    return hasCode && resp["error"]["code"].isInt() ? resp["error"]["code"].asInt() : -1;
  }
  Json::Value getErrMsg() const {
    const bool hasErrors = isValid() && Has(resp, "error") && Has(resp["error"], "errors");
    return hasErrors ? resp["error"]["errors"] : Json::Value();
  }
  Json::Value getErr() const { return getField("error"); }
  bool hasData() const { return isSuccess() && Has(resp, "data"); }
  Json::Value getData() const { return hasData() ? resp["data"] : Json::Value(); }
  bool hasDataField(const char* name) const {
    return name != nullptr && hasData() && Has(resp["data"], name);
  }
  Json::Value getDataField(const char* name) const {
    return hasDataField(name) ? resp["data"][name] : Json::Value();
  }
  std::string getDataFieldtoStr(const char* name) const {
    const Json::Value field = getDataField(name);
    return field.isString() ? field.asString() : "";
  }
  bool isPollFinish() const { return hasDataField("finish") && getDataField("finish").asBool(); }
  bool isPollSuccess() const { return hasDataField("success") && getDataField("success").asBool(); }
  std::string getTaskId() const {
    return hasDataField("task_id") ? getDataField("task_id").asString() : "";
  }
  bool hasAdditional() const { return hasDataField("additional"); }
  Json::Value getAdditional() const { return getDataField("additional"); }
  bool hasField(const char* name) const { return name != nullptr && Has(resp, name); }
  Json::Value getField(const char* name) const {
    return hasField(name) ? resp[name] : Json::Value();
  }

 private:
  static bool Has(const Json::Value& value, const char* name) {
    return value.isObject() && value.isMember(name);
  }

  Json::Value resp;
};

}  // namespace Model

class Web {
 public:
  void Step() { Draw::Once(2) ? OfRequest() : OfResponse(); }

 private:
  void OfRequest() {
    const Json::Value document = Draw::Once(2) ? Draw::Document() : Call();
    const std::string text = Draw::Text();
    const std::string key = Draw::Once(3) ? "version" : Draw::Name();
    const int number = static_cast<int>(Draw::Below(7)) - 2;
    const size_t kind = Draw::Below(14);
    Do("Request " + std::to_string(kind) + " " + ToText(document), [&](auto side) {
      auto& it = side(request);
      bool result = true;
      switch (kind) {
        case 0:
          it = {};
          break;
        case 1:
          it = {text, number, key, document};
          break;
        case 2:
          it = document;
          break;
        case 3:
          it.setAPI(text);
          break;
        case 4:
          it.setMethod(key);
          break;
        case 5:
          it.setVersion(number);
          break;
        case 6:
          it.setTimeout(number);
          break;
        case 7:
          it.setEncryptRequired(number > 0);
          break;
        case 8:
          it.setUploadFile({text, key});
          break;
        case 9:
          result = it.addParam(key, document);
          break;
        case 10:
          result = it.addParam(document);
          break;
        case 11:
          it.setRequest(document);
          break;
        case 12:
          result = it.addParam(key, it.getParams()) && it.isValidKey(text);
          break;
        default:
          it.clear();
      }
      if (ToText(it.getParams()).size() > 20000) it.clear();
      return Show(result, it.isValid(), it.toStr(), it.toJson(), it.getParams(), it.getAPI(),
                  it.getMethod(), it.getVersion(), it.getTimeout(), it.isEncryptRequired(),
                  it.getUploadFile().path, it.getUploadFile().name);
    });
  }

  // A document, and what may stand before and behind it, and what may not.
  static Model::DocumentText DrawText() {
    static const std::vector<std::string> allowed = {"", " ", "\n", "// c\n", "/* c */"};
    static const std::vector<std::string> refused = {"x", std::string(1, '\0'), "{}", "]", "1"};
    const Json::Value document = Draw::Document();
    const std::string text = ToText(document);
    if (Draw::Once(9)) return {"", {}, false};
    if (Draw::Once(6)) return {text + " " + Draw::Of(refused), {}, false};
    if (Draw::Once(6)) return {"\xef\xbb\xbf" + text, document, true};
    return {Draw::Of(allowed) + text + Draw::Of(allowed), document, true};
  }

  static const std::string& As(const Model::DocumentText& text, Library /*side*/) {
    return text.text;
  }
  static const Model::DocumentText& As(const Model::DocumentText& text, Modelled /*side*/) {
    return text;
  }

  static Json::Value Call() {
    Json::Value call = Draw::Document(1);
    if (!call.isObject()) call = Json::objectValue;
    for (const char* key : {"api", "method", "version"}) {
      if (!Draw::Once(4)) call[key] = Draw::Document(0);
    }
    return call;
  }
  static Json::Value Reply() {
    Json::Value reply;
    reply["success"] = !Draw::Once(3);
    if (!Draw::Once(4)) reply["data"] = Draw::Document();
    if (Draw::Once(2)) reply["error"] = Draw::Document();
    return reply;
  }

  void OfResponse() {
    const Json::Value document = Draw::Once(2) ? Draw::Document() : Reply();
    const Model::DocumentText text = DrawText();
    switch (Draw::Below(8)) {
      case 0:
        Do("setResp " + text.text, [&](auto side) {
          const bool result = side(reply).setResp(As(text, side));
          return Show(result, side(reply).getField("data"));
        });
        break;
      case 1:
        Do("a response of " + text.text, [&](auto side) {
          side(reply) = std::decay_t<decltype(side(reply))>(As(text, side));
          return Show(side(reply).getField("data"));
        });
        break;
      case 2:
        Do("clear", [&](auto side) {
          side(reply).clear();
          return Show(side(reply).isValid());
        });
        break;
      case 3:
      case 4:
        Do("setResp " + ToText(document), [&](auto side) {
          side(reply).setResp(document);
          return Show(side(reply).isValid());
        });
        break;
      default:
        break;
    }
    static const std::vector<const char*> names = {"success", "data",    "error", "id",
                                                   "",        "task_id", nullptr};
    const char* const name = Draw::Of(names);
    const size_t kind = Draw::Below(9);
    Do("query " + std::to_string(kind), [&](auto side) {
      const auto& it = side(reply);
      switch (kind) {
        case 0:
          return Show(it.isValid(), it.hasField(name), it.getField(name), it.getErr());
        case 1:
          return Show(it.getErrMsg());
        case 2:
          return Show(it.isSuccess(), it.hasData(), it.getData());
        case 3:
          return Show(it.getErrCode());
        case 4:
          return Show(it.hasDataField(name), it.getDataField(name));
        case 5:
          return Show(it.getDataFieldtoStr(name));
        case 6:
          return Show(it.isPollFinish());
        case 7:
          return Show(it.isPollSuccess());
        default:
          return Show(it.hasAdditional(), it.getAdditional(), it.getTaskId());
      }
    });
  }

  Twin<KeloDRCore::Request, Model::Request> request;
  Twin<KeloDRCore::Response, Model::Response> reply;
};

#endif  // KELODRCORE_TESTS_MODEL_WEB_H_

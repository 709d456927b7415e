#include "call.h"

#include <kelodrcore/err.h>
#include <kelodrcore/json_value.h>
#include <kelodrcore/response.h>

#include <charconv>
#include <cstdlib>
#include <fstream>
#include <iostream>
#include <optional>
#include <string>

#include "api.h"
#include "output.h"
#include "paths.h"

namespace drctl {

using namespace KeloDRCore;

namespace {

// No call comes near it; what is longer is not read.
constexpr size_t kMaxCall = size_t{1} << 20;

// At most `size` bytes.
std::string ReadUpTo(std::istream& in, size_t size) {
  std::string text(size, '\0');
  in.read(text.data(), static_cast<std::streamsize>(size));
  text.resize(static_cast<size_t>(in.gcount()));
  return text;
}

// The number of bytes that CONTENT_LENGTH announces.
std::optional<size_t> ContentLength() {
  const char* const text = std::getenv("CONTENT_LENGTH");
  if (text == nullptr) return std::nullopt;
  const std::string digits = text;
  size_t length = 0;
  const char* const end = digits.data() + digits.size();
  const auto result = std::from_chars(digits.data(), end, length);
  if (digits.empty() || result.ec != std::errc() || result.ptr != end) return std::nullopt;
  return length;
}

// `header`: one more line of the head, with its end.
void PrintCgi(const char* status, const Json::Value& reply, const char* header = "") {
  const std::string body = JsonValue::toString(reply) + "\n";
  std::cout << "Status: " << status << "\r\n"
            << header << "Content-Type: application/json\r\nContent-Length: " << body.size()
            << "\r\n\r\n"
            << body << std::flush;
}

void RunCgi(Api& api) {
  const char* const method = std::getenv("REQUEST_METHOD");
  if (method == nullptr || std::string(method) != "POST") {
    return PrintCgi("405 Method Not Allowed", api.Refuse(ERR::BAD_PARAMETER, "send a POST"),
                    "Allow: POST\r\n");
  }
  const std::optional<size_t> length = ContentLength();
  if (!length) {
    return PrintCgi("411 Length Required", api.Refuse(ERR::BAD_PARAMETER, "no content length"));
  }
  if (*length > kMaxCall) {
    return PrintCgi("413 Payload Too Large",
                    api.Refuse(ERR::BAD_PARAMETER, "the call is too long"));
  }
  const std::string text = ReadUpTo(std::cin, *length);
  if (text.size() < *length) {
    return PrintCgi("400 Bad Request", api.Refuse(ERR::BAD_PARAMETER, "the body is cut short"));
  }
  PrintCgi("200 OK", api.Answer(text));
}

Json::Value AnswerStream(Api& api, std::istream& in) {
  if (!in) return api.Refuse(ERR::BAD_PARAMETER, "the call cannot be read");
  const std::string text = ReadUpTo(in, kMaxCall + 1);
  if (text.size() > kMaxCall) return api.Refuse(ERR::BAD_PARAMETER, "the call is too long");
  return api.Answer(text);
}

Json::Value AnswerOnce(Api& api, const std::string& file) {
  if (file.empty()) return AnswerStream(api, std::cin);
  std::ifstream in(file, std::ios::binary);
  return AnswerStream(api, in);
}

}  // namespace

int Call(const Options& options) {
  MakeDefaultDir(options.db);  // the directories below would make it readable by all
  Api api(options.db, options.cacheDir.empty() ? options.db + ".cache" : options.cacheDir,
          options.stateDir.empty() ? options.db + ".tasks" : options.stateDir, options.maxAge);
  if (options.cgi) {
    RunCgi(api);
    return 0;
  }
  const Json::Value reply = AnswerOnce(api, options.callFile);
  PrintJson(reply);
  return Response(reply).isSuccess() ? 0 : 1;
}

}  // namespace drctl

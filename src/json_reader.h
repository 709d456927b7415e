// JSON text to values.

#ifndef KELODRCORE_SRC_JSON_READER_H_
#define KELODRCORE_SRC_JSON_READER_H_

#include <json/json.h>

#include <string>

namespace KeloDRCore {

// Parses one document and nothing after it but white space and comments. It accepts what JsonCpp's
// reader accepts with its default settings, and answers with the same value; but JsonCpp reads
// numbers in the locale that the process has set (where the comma is the decimal point, it takes
// 1.5 for another number or for an error) and takes a NUL byte for the end of the text.
class JsonReader {
 public:
  explicit JsonReader(const std::string& document)
      : current(document.data()), end(document.data() + document.size()) {}

  // False with `root` unspecified. Texts and names too long for a Json::Value throw
  // Json::Exception.
  bool Read(Json::Value& root);

 private:
  enum class Kind {
    kObjectBegin,
    kObjectEnd,
    kArrayBegin,
    kArrayEnd,
    kColon,
    kComma,
    kString,
    kNumber,
    kTrue,
    kFalse,
    kNull,
    kComment,
    kEnd,
    kError
  };
  struct Token {
    Kind kind;
    const char* start;
    const char* end;
  };

  Token Next();
  Token NextBeyondComments();
  Kind Scan();
  char Take() { return current == end ? '\0' : *current++; }
  void SkipSpaces();
  void SkipDigits();
  bool SkipWord(const char* word);
  bool SkipString();
  bool SkipComment();
  void SkipNumber();
  void SkipByteOrderMark() { SkipWord("\xEF\xBB\xBF"); }

  bool ReadValue(Json::Value& value, int depth);
  bool ReadObject(Json::Value& value, int depth);
  bool ReadArray(Json::Value& value, int depth);

  const char* current;
  const char* const end;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_JSON_READER_H_

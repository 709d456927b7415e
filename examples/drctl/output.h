// How rows and errors are shown.

#ifndef DRCTL_OUTPUT_H_
#define DRCTL_OUTPUT_H_

#include <json/json.h>

#include <string>
#include <vector>

#include "rows.h"

namespace drctl {

// Writes rows to standard output one by one: as a table with a line of headings, or as one line of
// JSON. Nothing is written before the first row or the end.
class RowPrinter {
 public:
  RowPrinter(const std::vector<Column>& printedColumns, bool isJson)
      : columns(printedColumns), asJson(isJson) {}

  // False when nothing more can be written.
  bool Print(const KeloDRCore::SqliteValueList& row);

  // What stands after the last row.
  void End();

 private:
  void Begin();

  const std::vector<Column>& columns;
  bool asJson;
  bool isBegun = false;
};

// The text without control characters, which must not reach a terminal as such.
std::string Printable(std::string text);

void PrintJson(const Json::Value& value);

// Prints what a change has done: a sentence for people, or the counts as JSON.
void PrintDone(const std::string& sentence, const Json::Value& counts, bool asJson);

// A failure as a document of the form that `SqliteDB::GetErr` gives.
Json::Value MakeErr(int code, const Json::Value& message);

// Writes a failure to standard error: "drctl: WHAT: reason (NAME OF THE CODE)" for people, or the
// document as one line of JSON. Returns the exit status of a failure.
int Complain(const std::string& what, const Json::Value& err, bool asJson);

}  // namespace drctl

#endif  // DRCTL_OUTPUT_H_

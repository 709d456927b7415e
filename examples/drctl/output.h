// How rows and errors are shown.

#ifndef DRCTL_OUTPUT_H_
#define DRCTL_OUTPUT_H_

#include <json/json.h>

#include <string>
#include <vector>

#include "rows.h"

namespace drctl {

// One line of JSON, or a table with a line of headings; to standard output.
void Print(const Rows& rows, const std::vector<Column>& columns, bool asJson);
void PrintJson(const Json::Value& value);

// "drctl: what: error document", to standard error. Returns the exit status of a failure.
int Complain(const std::string& what, const Json::Value& err);

}  // namespace drctl

#endif  // DRCTL_OUTPUT_H_

// The rows of the registry, their columns, and their form as JSON.

#ifndef DRCTL_ROWS_H_
#define DRCTL_ROWS_H_

#include <json/json.h>
#include <kelodrcore/sqlite_value.h>

#include <string>
#include <vector>

namespace drctl {

using Rows = std::vector<KeloDRCore::SqliteValueList>;

// Numbers are unsigned and have 32 bits; a time is the number of seconds since the epoch.
enum class Kind { kText, kNumber, kTime };

// A column, as commands and output name it.
struct Column {
  std::string name;
  Kind kind;
  size_t width;  // in a table; what is longer moves the rest of its line

  bool IsNumber() const { return kind != Kind::kText; }
};

const std::vector<Column>& NodeColumns();
const std::vector<Column>& VolumeColumns();

// The names of the columns, for messages: "name, address, port, state".
std::string Names(const std::vector<Column>& columns);

// Null when there is no such column.
const Column* FindColumn(const std::vector<Column>& columns, const std::string& name);

// A row as an object with the columns that it has, and all rows as an array of them.
Json::Value ToJson(const KeloDRCore::SqliteValueList& row, const std::vector<Column>& columns);
Json::Value ToJson(const Rows& rows, const std::vector<Column>& columns);

// Sets the fields of `row` from the members of `object`. Empty, or what is wrong with the object:
// no object at all, a member that is no column, a value of the wrong type. Missing members are
// fine.
std::string FromJson(const Json::Value& object, const std::vector<Column>& columns,
                     KeloDRCore::SqliteValueList& row);

// Empty when the fields of a node are good, else what is wrong with them. `isWhole`: all must be
// there.
std::string CheckNode(const KeloDRCore::SqliteValueList& node, bool isWhole);

// The same for a whole volume.
std::string CheckVolume(const KeloDRCore::SqliteValueList& volume);

}  // namespace drctl

#endif  // DRCTL_ROWS_H_

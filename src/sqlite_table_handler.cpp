#include "kelodrcore/sqlite_table_handler.h"

namespace KeloDRCore {

SqliteTableHandler::SqliteTableHandler() = default;

SqliteTableHandler::SqliteTableHandler(const std::string& name, const std::string& columns)
    : tableName(name), columnDefs(columns) {}

SqliteTableHandler::SqliteTableHandler(const SqliteTableHandler& other) = default;

SqliteTableHandler& SqliteTableHandler::operator=(const SqliteTableHandler& other) = default;

SqliteTableHandler::~SqliteTableHandler() = default;

}  // namespace KeloDRCore

#include "kelodrcore/sqlite_table_handler.h"

namespace KeloDRCore {

SqliteTableHandler::SqliteTableHandler() = default;

SqliteTableHandler::SqliteTableHandler(const std::string& newTableName,
                                       const std::string& newColumnDefs)
    : tableName(newTableName), columnDefs(newColumnDefs) {}

SqliteTableHandler::SqliteTableHandler(const SqliteTableHandler& other) = default;

SqliteTableHandler& SqliteTableHandler::operator=(const SqliteTableHandler& other) = default;

SqliteTableHandler::~SqliteTableHandler() = default;

}  // namespace KeloDRCore

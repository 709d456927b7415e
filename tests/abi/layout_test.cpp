// Slots and fields of the exported classes, in the order that programs compiled earlier rely on.

#include <dlfcn.h>
#include <elf.h>
#include <link.h>

#include <cstddef>
#include <cstring>
#include <string>
#include <vector>

#include "kelodrcore/cache.h"
#include "kelodrcore/file_lock.h"
#include "kelodrcore/request.h"
#include "kelodrcore/response.h"
#include "kelodrcore/sqlite_command.h"
#include "kelodrcore/sqlite_condition.h"
#include "kelodrcore/sqlite_db.h"
#include "kelodrcore/sqlite_table_handler.h"
#include "kelodrcore/sqlite_value.h"
#include "support/clean_test.h"

namespace layout {

using namespace KeloDRCore;

struct Field {
  size_t offset;
  size_t size;
  size_t alignment;
};

// In the Itanium C++ ABI a pointer to a data member is its offset.
template <typename Class, typename Type>
Field FieldAt(Type Class::*member) {
  ptrdiff_t offset = 0;
  static_assert(sizeof(member) == sizeof(offset));
  std::memcpy(&offset, &member, sizeof(offset));
  return {size_t(offset), sizeof(Type), alignof(Type)};
}

// An explicit instantiation may name private members; this one hands their places out.
template <typename Class, auto... members>
struct FieldsOf {
  friend std::vector<Field> Fields(const Class* /*tag*/) { return {FieldAt(members)...}; }
};

#define FIELDS(Class, ...)                     \
  std::vector<Field> Fields(const Class* tag); \
  template struct FieldsOf<Class, __VA_ARGS__>

FIELDS(SqliteValue, &SqliteValue::valid, &SqliteValue::value);
FIELDS(SqliteValueList, &SqliteValueList::nullValue, &SqliteValueList::values);
FIELDS(SqliteTableHandler, &SqliteTableHandler::tableName, &SqliteTableHandler::columnDefs);
FIELDS(SqliteCondition, &SqliteCondition::text);
FIELDS(SqliteInFamily, &SqliteInFamily::keyword);
FIELDS(SqliteCommand, &SqliteCommand::table);
FIELDS(InsertCommand, &InsertCommand::replacable, &InsertCommand::fieldValues);
FIELDS(UpdateCommand, &UpdateCommand::condition, &UpdateCommand::fieldValues);
FIELDS(SelectCommand, &SelectCommand::selectAll, &SelectCommand::orderByASC, &SelectCommand::offset,
       &SelectCommand::limit, &SelectCommand::fields, &SelectCommand::orderFields,
       &SelectCommand::condition);
FIELDS(DeleteCommand, &DeleteCommand::deleteAll, &DeleteCommand::condition);
FIELDS(ErrRecorder, &ErrRecorder::errCode, &ErrRecorder::errMsg);
FIELDS(SqliteDB, &SqliteDB::dbHandle, &SqliteDB::dbPath, &SqliteDB::retryLimit,
       &SqliteDB::logLabel);
FIELDS(FileLock, &FileLock::fd, &FileLock::path);
FIELDS(Request, &Request::version, &Request::timeout, &Request::api, &Request::method,
       &Request::params, &Request::encryptRequired, &Request::uploadFile);
FIELDS(UploadFileDescription, &UploadFileDescription::path, &UploadFileDescription::name);
FIELDS(Response, &Response::nullValue, &Response::resp);
FIELDS(Cache, &Cache::path, &Cache::timeout, &Cache::alwaysRequired, &Cache::retryLimit,
       &Cache::cachedData, &Cache::loadedMtime);

size_t RoundUp(size_t value, size_t alignment) {
  return (value + alignment - 1) / alignment * alignment;
}

// The fields stand in this order from `start` to the end of the class, with nothing but padding
// between them: none is missing from the list.
template <typename Class>
void ExpectFieldsFrom(size_t start) {
  size_t place = start;
  for (const Field& field : Fields(static_cast<const Class*>(nullptr))) {
    EXPECT_EQ(field.offset, RoundUp(place, field.alignment));
    place = field.offset + field.size;
  }
  EXPECT_EQ(RoundUp(place, alignof(Class)), sizeof(Class));
}

constexpr size_t kNoVirtuals = 0;
constexpr size_t kVirtuals = sizeof(void*);

TEST(LayoutTest, FieldsStandInDeclaredOrder) {
  ExpectFieldsFrom<SqliteValue>(kNoVirtuals);
  ExpectFieldsFrom<SqliteValueList>(kVirtuals);
  ExpectFieldsFrom<SqliteTableHandler>(kVirtuals);
  ExpectFieldsFrom<SqliteCondition>(kVirtuals);
  ExpectFieldsFrom<SqliteInFamily>(sizeof(SqliteCondition));
  ExpectFieldsFrom<SqliteCommand>(kVirtuals);
  ExpectFieldsFrom<InsertCommand>(sizeof(SqliteCommand));
  ExpectFieldsFrom<UpdateCommand>(sizeof(SqliteCommand));
  ExpectFieldsFrom<SelectCommand>(sizeof(SqliteCommand));
  ExpectFieldsFrom<DeleteCommand>(sizeof(SqliteCommand));
  ExpectFieldsFrom<ErrRecorder>(kVirtuals);
  ExpectFieldsFrom<SqliteDB>(sizeof(ErrRecorder));
  ExpectFieldsFrom<FileLock>(kNoVirtuals);
  ExpectFieldsFrom<Request>(kVirtuals);
  ExpectFieldsFrom<UploadFileDescription>(kNoVirtuals);
  ExpectFieldsFrom<Response>(kVirtuals);
  ExpectFieldsFrom<Cache>(kVirtuals);
}

TEST(LayoutTest, ConditionsWithoutFieldsOfTheirOwnAddNone) {
  EXPECT_EQ(sizeof(SqliteEqual), sizeof(SqliteCondition));
  EXPECT_EQ(sizeof(SqliteNotEqual), sizeof(SqliteCondition));
  EXPECT_EQ(sizeof(SqliteAnd), sizeof(SqliteCondition));
  EXPECT_EQ(sizeof(SqliteOr), sizeof(SqliteCondition));
  EXPECT_EQ(sizeof(SqliteIsNull), sizeof(SqliteCondition));
  EXPECT_EQ(sizeof(SqliteIn), sizeof(SqliteInFamily));
  EXPECT_EQ(sizeof(SqliteNotIn), sizeof(SqliteInFamily));
  EXPECT_EQ(sizeof(SqliteRecord), sizeof(void*));
}

// Only the field shows it, because a condition that was set never becomes empty again.
TEST(LayoutTest, AConditionTakesADeletesPermissionBack) {
  DeleteCommand command;
  const auto deletesAll = [&command] {
    bool flag = false;
    const size_t place = Fields(&command).front().offset;
    std::memcpy(&flag, reinterpret_cast<const char*>(&command) + place, sizeof(flag));
    return flag;
  };
  EXPECT_FALSE(deletesAll());
  command.DeleteAll();
  EXPECT_TRUE(deletesAll());
  EXPECT_FALSE(command.SetCondition(""));
  EXPECT_TRUE(deletesAll());
  EXPECT_TRUE(command.SetCondition("id=1"));
  EXPECT_FALSE(deletesAll());
}

// In the Itanium C++ ABI a pointer to a virtual function is one more than its slot's offset.
template <typename Function>
size_t SlotOf(Function function) {
  ptrdiff_t place = 0;
  std::memcpy(&place, &function, sizeof(place));
  EXPECT_EQ(place % ptrdiff_t(sizeof(void*)), 1) << "not virtual";
  return size_t(place) / sizeof(void*);
}

// How many slots the virtual table of a class has, its destructors' two included.
size_t SlotsIn(const std::string& className) {
  const std::string symbol =
      "_ZTVN10KeloDRCore" + std::to_string(className.size()) + className + "E";
  void* const table = dlsym(RTLD_DEFAULT, symbol.c_str());
  Dl_info info = {};
  ElfW(Sym)* entry = nullptr;
  if (table == nullptr ||
      dladdr1(table, &info, reinterpret_cast<void**>(&entry), RTLD_DL_SYMENT) == 0 ||
      entry == nullptr) {
    ADD_FAILURE() << "no virtual table of " << className;
    return 0;
  }
  constexpr size_t kOffsetToTopAndTypeInfo = 2;
  return entry->st_size / sizeof(void*) - kOffsetToTopAndTypeInfo;
}

TEST(LayoutTest, ValueListAndTableHandlerHaveOnlyADestructor) {
  EXPECT_EQ(SlotsIn("SqliteValueList"), 2U);
  EXPECT_EQ(SlotsIn("SqliteTableHandler"), 2U);
}

TEST(LayoutTest, RequestAndResponseHaveOnlyADestructor) {
  EXPECT_EQ(SlotsIn("Request"), 2U);
  EXPECT_EQ(SlotsIn("Response"), 2U);
}

TEST(LayoutTest, ARecordHasThreeSlotsAndNoDestructor) {
  EXPECT_EQ(SlotOf(&SqliteRecord::ConvertColumns), 0U);
  EXPECT_EQ(SlotOf(&SqliteRecord::FromSqliteRecord), 1U);
  EXPECT_EQ(SlotOf(&SqliteRecord::GetColumns), 2U);
  EXPECT_FALSE(std::has_virtual_destructor_v<SqliteRecord>);
}

TEST(LayoutTest, AConditionHasOneSlotAndNoDestructor) {
  EXPECT_EQ(SlotOf(&SqliteCondition::IsValid), 0U);
  for (const char* const name :
       {"SqliteCondition", "SqliteEqual", "SqliteNotEqual", "SqliteAnd", "SqliteOr", "SqliteIsNull",
        "SqliteInFamily", "SqliteIn", "SqliteNotIn"}) {
    EXPECT_EQ(SlotsIn(name), 1U) << name;
  }
}

TEST(LayoutTest, CommandsHaveDestructorThenThreeSlots) {
  EXPECT_EQ(SlotOf(&SqliteCommand::GetCommand), 2U);
  EXPECT_EQ(SlotOf(&SqliteCommand::IsValid), 3U);
  EXPECT_EQ(SlotOf(&SqliteCommand::DumpParam), 4U);
  for (const char* const name :
       {"SqliteCommand", "InsertCommand", "UpdateCommand", "SelectCommand", "DeleteCommand"}) {
    EXPECT_EQ(SlotsIn(name), 5U) << name;
  }
}

TEST(LayoutTest, TheDatabaseAddsItsDestructorBehindTheRecordersSlots) {
  EXPECT_EQ(SlotOf(&ErrRecorder::GetErr), 0U);
  EXPECT_EQ(SlotOf(&ErrRecorder::GetErrCodeStr), 1U);
  EXPECT_EQ(SlotsIn("ErrRecorder"), 2U);
  EXPECT_EQ(SlotsIn("SqliteDB"), 4U);
}

TEST(LayoutTest, ACacheHasItsDestructorThenSixSlots) {
  EXPECT_EQ(SlotOf(&Cache::GetInfo), 2U);
  EXPECT_EQ(SlotOf(&Cache::GetDefaultValue), 3U);
  EXPECT_EQ(SlotOf(&Cache::GetUpdatedData), 4U);
  EXPECT_EQ(SlotOf(&Cache::IsValidData), 5U);
  EXPECT_EQ(SlotOf(&Cache::IsNeedUpdate), 6U);
  EXPECT_EQ(SlotOf(&Cache::IsUpdatedDataRequired), 7U);
  EXPECT_EQ(SlotsIn("Cache"), 8U);
}

}  // namespace layout

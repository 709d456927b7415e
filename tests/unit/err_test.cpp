#include "kelodrcore/err.h"

#include <algorithm>
#include <cstdint>
#include <map>
#include <string>
#include <type_traits>

#include "kelodrcore/sqlite_command.h"
#include "support/clean_test.h"

namespace {

namespace ERR = KeloDRCore::ERR;

using ErrTest = CleanTest;

struct Row {
  int number;
  int constant;
  const char* name;
};

const Row kRows[] = {
    {400, ERR::ERR_DR_MIN, "ERR_DR_MIN"},
    {401, ERR::BAD_PARAMETER, "BAD_PARAMETER"},
    {402, ERR::ERR_ALLOCATE_MEMORY, "ERR_ALLOCATE_MEMORY"},
    {403, ERR::ERR_NULL_POINTER, "ERR_NULL_POINTER"},
    {404, ERR::ERR_DATABASE_OPERATION, "ERR_DATABASE_OPERATION"},
    {405, ERR::ERR_DATABASE_LOCK, "ERR_DATABASE_LOCK"},
    {406, ERR::ERR_FORK_FAILED, "ERR_FORK_FAILED"},
    {407, ERR::ERR_UNKNOWN, "ERR_UNKNOWN"},
    {500, ERR::ERR_CONNECTION_FAILED, "ERR_CONNECTION_FAILED"},
    {501, ERR::ERR_LOGIN_AUTH_INVALID, "ERR_LOGIN_AUTH_INVALID"},
    {502, ERR::ERR_LOGIN_AUTH_DISABLED, "ERR_LOGIN_AUTH_DISABLED"},
    {503, ERR::ERR_LOGIN_AUTH_PRIVILEGE, "ERR_LOGIN_AUTH_PRIVILEGE"},
    {504, ERR::ERR_LOGIN_AUTH_REQUIRED_OTP, "ERR_LOGIN_AUTH_REQUIRED_OTP"},
    {505, ERR::ERR_LOGIN_AUTH_INVALID_OTP, "ERR_LOGIN_AUTH_INVALID_OTP"},
    {506, ERR::ERR_INIT_CREDENTIAL, "ERR_INIT_CREDENTIAL"},
    {507, ERR::ERR_NODE_NOT_EXIST, "ERR_NODE_NOT_EXIST"},
    {508, ERR::ERR_NODE_EXIST, "ERR_NODE_EXIST"},
    {509, ERR::ERR_NODE_INVALID_REMOTE_SESSION_CREATE, "ERR_NODE_INVALID_REMOTE_SESSION_CREATE"},
    {510, ERR::ERR_NODE_CREATE, "ERR_NODE_CREATE"},
    {511, ERR::ERR_NODE_SESSION_CREATE, "ERR_NODE_SESSION_CREATE"},
    {512, ERR::ERR_NODE_SESSION_REMOVE, "ERR_NODE_SESSION_REMOVE"},
    {513, ERR::ERR_NODE_GET, "ERR_NODE_GET"},
    {514, ERR::ERR_NODE_SET, "ERR_NODE_SET"},
    {515, ERR::ERR_NODE_LIST, "ERR_NODE_LIST"},
    {516, ERR::ERR_CRED_NOT_EXIST, "ERR_CRED_NOT_EXIST"},
    {517, ERR::ERR_INVALID_CONN, "ERR_INVALID_CONN"},
    {518, ERR::ERR_NOT_SAME_NODE, "ERR_NOT_SAME_NODE"},
    {519, ERR::ERR_GET_NODE_INFO, "ERR_GET_NODE_INFO"},
    {520, ERR::ERR_INVALID_SENDER, "ERR_INVALID_SENDER"},
    {521, ERR::ERR_INVALID_SESSION, "ERR_INVALID_SESSION"},
    {522, ERR::ERR_NOT_AVALIABLE_CONN, "ERR_NOT_AVALIABLE_CONN"},
    {523, ERR::ERR_LOGIN_AUTH, "ERR_LOGIN_AUTH"},
    {524, ERR::ERR_CREDENTIAL_OPERATION, "ERR_CREDENTIAL_OPERATION"},
    {525, ERR::ERR_NO_PERMISSION, "ERR_NO_PERMISSION"},
    {526, ERR::ERR_NO_SUCH_API, "ERR_NO_SUCH_API"},
    {527, ERR::ERR_INVALID_USER, "ERR_INVALID_USER"},
    {528, ERR::ERR_SESSION_GET, "ERR_SESSION_GET"},
    {599, ERR::ERR_NODE_UNKNOWN, "ERR_NODE_UNKNOWN"},
    {673, ERR::ERR_DR_MAX, "ERR_DR_MAX"},
};

TEST_F(ErrTest, EveryCodeHasItsNumberAndName) {
  for (const Row& row : kRows) {
    EXPECT_EQ(row.constant, row.number) << row.name;
    EXPECT_EQ(ERR::ToString(row.number), row.name);
  }
}

TEST_F(ErrTest, EveryOtherNumberIsUnknown) {
  std::map<int, std::string> named;
  for (const Row& row : kRows) named[row.number] = row.name;
  for (int code = -2000; code <= 2000; ++code) {
    if (named.count(code) != 0) continue;
    EXPECT_EQ(ERR::ToString(code), "<UNKNOWN ERR CODE>") << code;
  }
  for (const int code : {INT32_MIN, INT32_MAX, -1, 0, 399, 408, 499, 529, 598, 600, 672, 674}) {
    EXPECT_EQ(ERR::ToString(code), "<UNKNOWN ERR CODE>") << code;
  }
}

TEST_F(ErrTest, ACodeIsAnIntConstant) {
  static_assert(std::is_same_v<decltype(ERR::BAD_PARAMETER), const int>);
  static_assert(std::is_same_v<decltype(ERR::ERR_DR_MAX), const int>);
  const int code = 5;
  EXPECT_EQ(std::max(code, ERR::ERR_UNKNOWN), 407);
  auto copy = ERR::BAD_PARAMETER;
  copy = code;
  EXPECT_EQ(copy, 5);
}

TEST_F(ErrTest, ACodeCanBeStoredInAColumn) {
  KeloDRCore::InsertCommand command;
  EXPECT_TRUE(command.AddFieldValue("code", ERR::ERR_UNKNOWN));
  EXPECT_EQ(command.ToFormatedInsertValues(), "(code) VALUES (407)");
  KeloDRCore::SqliteValueList list;
  EXPECT_TRUE(list.AddValue("code", ERR::ERR_UNKNOWN));
}

}  // namespace

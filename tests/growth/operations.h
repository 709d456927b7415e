// The operations whose cost is counted at two sizes.

#ifndef KELODRCORE_TESTS_GROWTH_OPERATIONS_H_
#define KELODRCORE_TESTS_GROWTH_OPERATIONS_H_

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

using Work = std::function<void()>;

enum class Growth { kConstant, kLinear };

struct Operation {
  std::string name;
  size_t size;                           // the smaller one
  std::function<Work(size_t)> prepared;  // the work of a size; what prepares it is not counted
  Growth heap = Growth::kLinear;
  Growth instructions = Growth::kLinear;
};

// Ends the program: work that fails early would look cheap.
void Require(bool isDone, const char* what);

// Of the scratch directory.
std::string Path(const std::string& name);

void AddDocuments(std::vector<Operation>& operations);
void AddFiles(std::vector<Operation>& operations);
void AddStatements(std::vector<Operation>& operations);
void AddRows(std::vector<Operation>& operations);
void AddMessages(std::vector<Operation>& operations);
void AddLocksAndCaches(std::vector<Operation>& operations);

#endif  // KELODRCORE_TESTS_GROWTH_OPERATIONS_H_

#include "paths.h"

#include <filesystem>

namespace drctl {

std::string AbsolutePath(const std::string& path) {
  std::error_code error;
  std::filesystem::path result = std::filesystem::absolute(path, error);
  if (!error) result = std::filesystem::weakly_canonical(result, error);
  return error ? path : result.string();
}

}  // namespace drctl

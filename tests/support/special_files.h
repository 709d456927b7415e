// Files that are not regular ones, for tests of what opens a file.

#ifndef KELODRCORE_TESTS_SUPPORT_SPECIAL_FILES_H_
#define KELODRCORE_TESTS_SUPPORT_SPECIAL_FILES_H_

#include <string>

// Makes a socket at `path`: a file that is there and that nobody can open, root included.
void MakeSocket(const std::string& path);

#endif  // KELODRCORE_TESTS_SUPPORT_SPECIAL_FILES_H_

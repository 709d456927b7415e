// Files that are not regular ones, for tests of what opens a file.

#ifndef KELODRCORE_TESTS_SUPPORT_SPECIAL_FILES_H_
#define KELODRCORE_TESTS_SUPPORT_SPECIAL_FILES_H_

#include <functional>
#include <string>

// Makes a socket at `path`: a file that is there and that nobody can open, root included.
void MakeSocket(const std::string& path);

// Expects that `read`, given a path at which it finds `text`, opens that file close-on-exec. The
// file is a queue made at `path`, which lets the test look while the file is open.
void ExpectOpenedCloseOnExec(const std::string& path, const std::string& text,
                             const std::function<void(const std::string&)>& read);

#endif  // KELODRCORE_TESTS_SUPPORT_SPECIAL_FILES_H_

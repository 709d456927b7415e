#include "support/special_files.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <set>
#include <thread>

#include "support/clean_test.h"

void MakeSocket(const std::string& path) {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  ASSERT_LT(path.size(), sizeof(address.sun_path));
  strcpy(address.sun_path, path.c_str());
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  EXPECT_EQ(bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  close(fd);
}

void ExpectOpenedCloseOnExec(const std::string& path, const std::string& text,
                             const std::function<void(const std::string&)>& read) {
  ASSERT_EQ(mkfifo(path.c_str(), 0600), 0);
  const std::set<int> before = OpenDescriptors();
  std::thread reader([&] { read(path); });
  // Opens once the reader has opened its end, which then waits for the text.
  const int writer = open(path.c_str(), O_WRONLY | O_CLOEXEC);
  // The two ends let go of each other before either has its descriptor.
  while (OpenDescriptors().size() < before.size() + 2) std::this_thread::yield();
  for (const int fd : OpenDescriptors()) {
    if (before.count(fd) != 0) continue;
    EXPECT_NE(fcntl(fd, F_GETFD) & FD_CLOEXEC, 0) << fd;
  }
  EXPECT_EQ(write(writer, text.data(), text.size()), static_cast<ssize_t>(text.size()));
  close(writer);
  reader.join();
}

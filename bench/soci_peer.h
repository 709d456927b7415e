// SOCI's side of the SQL work, apart from the other files: its header declares SQLite's interface
// in a namespace of its own.

#ifndef KELODRCORE_BENCH_SOCI_PEER_H_
#define KELODRCORE_BENCH_SOCI_PEER_H_

#include <memory>
#include <string>
#include <vector>

#include "nodes.h"

namespace bench {

void InsertWithSoci(const std::string& path, const std::vector<Node>& nodes);

// A connection that lasts over several selections.
class SociSession {
 public:
  explicit SociSession(const std::string& path);
  ~SociSession();
  SociSession(const SociSession&) = delete;
  SociSession& operator=(const SociSession&) = delete;

  void Select(const std::string& sql, std::vector<Record>& records);

 private:
  struct Session;
  std::unique_ptr<Session> session;
};

}  // namespace bench

#endif  // KELODRCORE_BENCH_SOCI_PEER_H_

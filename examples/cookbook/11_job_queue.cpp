#include <kelodrcore/sqlite_db.h>
#include <kelodrcore/sqlite_transaction.h>
#include <sys/wait.h>
#include <unistd.h>

#include <iostream>

using namespace KeloDRCore;

// `worker` is the process that has taken the job, 0 while nobody has.
const SqliteTableHandler kJobs("job",
                               "id INTEGER PRIMARY KEY, worker INTEGER NOT NULL DEFAULT 0, "
                               "runs INTEGER NOT NULL DEFAULT 0");
constexpr int kProcesses = 4;
constexpr unsigned int kJobCount = 20;
constexpr unsigned int kRetries = 10;

bool AddJobs(SqliteDB& db) {
  std::vector<SqliteValueList> jobs;
  for (unsigned int id = 1; id <= kJobCount; ++id) {
    SqliteValueList job;
    job.AddValue("id", id);
    jobs.push_back(job);
  }
  return db.InsertRecords(kJobs, jobs);
}

// Takes the oldest free job; `id` is 0 when there is none. One statement looks and takes, so that
// no two processes take the same job. In a transaction the row counts only once it is committed.
bool Claim(SqliteDB& db, unsigned int& id) {
  id = 0;
  SqliteTransaction transaction(db);
  SqliteValueList job;
  if (!transaction.IsOpen() ||
      !db.SelectByCommand("UPDATE job SET worker=" + std::to_string(getpid()) +
                              " WHERE id=(SELECT min(id) FROM job WHERE worker=0) RETURNING id",
                          job)) {
    return false;
  }
  return (job.GetValues().empty() || job.GetValue("id", id)) && transaction.Commit();
}

bool Finish(SqliteDB& db, unsigned int id) {
  return db.Exec("UPDATE job SET runs=runs+1 WHERE id=" + std::to_string(id));
}

// A process of its own, with a handle of its own: an open one must not be used after a fork.
bool Work() {
  SqliteDB db("jobs.db", kRetries, "cookbook");
  for (;;) {
    unsigned int id = 0;
    if (!Claim(db, id)) return false;
    if (id == 0) return true;
    if (!Finish(db, id)) return false;
  }
}

int main() {
  SqliteDB db("jobs.db", kRetries, "cookbook");
  if (!AddJobs(db)) return 1;
  db.Close();
  for (int process = 0; process < kProcesses; ++process) {
    const pid_t child = fork();
    if (child < 0) return 1;
    if (child == 0) _exit(Work() ? 0 : 1);
  }
  for (int status = 0; wait(&status) > 0;) {
    if (status != 0) return 1;
  }
  SqliteValueList row;
  unsigned int done = 0;
  if (!db.SelectByCommand("SELECT count() AS done FROM job WHERE runs=1", row) ||
      !row.GetValue("done", done)) {
    return 1;
  }
  std::cout << kProcesses << " processes did " << done << " of " << kJobCount
            << " jobs, each of them once\n";
}

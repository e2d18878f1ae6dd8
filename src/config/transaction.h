// One change of a configuration file under its lock: lock (exclusive), load, change, save, tell
// whoever must hear of the change, unlock. Both managers change their files this way.
//
// The lock is released when the transaction goes out of scope, whichever way that is: a return
// on any failure, or an exception (jsoncpp throws when a request's value is read as the wrong
// type). Config's own destructor leaves the lock alone, so a bare Config would keep it. What the
// caller does after Commit() and before the scope ends happens under the lock: the daemon and the
// monitor hear of a change once it is on disk and before another writer may change it again.
// One process, one thread per transaction.
#ifndef FILEINDEX_SRC_CONFIG_TRANSACTION_H_
#define FILEINDEX_SRC_CONFIG_TRANSACTION_H_

#include "fileindex/config.h"

namespace WEZO {
namespace FILEINDEX {

class ConfigTransaction {
 public:
  // Works on `config`, which must outlive the transaction. Takes no lock yet.
  explicit ConfigTransaction(Config& config) : m_config(config) {}
  ~ConfigTransaction() { m_config.Unlock(); }

  ConfigTransaction(const ConfigTransaction&) = delete;
  ConfigTransaction& operator=(const ConfigTransaction&) = delete;

  // Takes the file's exclusive lock and loads the file. False, logged with a code set by
  // Config, when either fails; the file is then neither loaded nor changed.
  bool Begin() { return m_config.Lock(true) && m_config.Load(); }

  // Saves the changed file; the lock stays held until the transaction ends. False, logged with a
  // code set, when the file cannot be saved.
  bool Commit() { return m_config.Save(); }

 private:
  Config& m_config;
};

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_CONFIG_TRANSACTION_H_

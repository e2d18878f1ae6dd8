// Client of the platform's file-change monitor.
//
// The monitor watches directories for its clients and appends one JSON line per event it sees to
// the queue file that a client's registration names. A registration is identified by the client
// name and the queue path; its entry lists the directories to watch:
//
//   {"queue": "<queue file>",
//    "config": [{"path": "<directory>", "mask": <event classes>, "ignore": ["<name>", ...]}, ...]}
//
// Upsert and Delete are implemented by the platform beside the operations of wezo/platform.h.
// They may be called from any process; the monitor serialises the registry itself.
#ifndef WEZO_WEZOTIFYD_H_
#define WEZO_WEZOTIFYD_H_

#include <json/value.h>

#include <stdexcept>
#include <string>

namespace WEZO {
namespace WEZOTIFYD {

enum QueueType {
  QUEUE_TYPE_FILE = 1,  // events are appended to a file, one JSON line each
};

class MonitorQueue {
 public:
  // Builds a registration entry from its JSON description. Throws std::invalid_argument when the
  // description is not an object with a non-empty string "queue" and an array "config" of
  // objects, each with a non-empty string "path", an integer "mask" and an array of strings
  // "ignore".
  explicit MonitorQueue(const Json::Value& description) : m_entry(description) {
    if (!description.isObject() || !description["queue"].isString() ||
        description["queue"].asString().empty() || !description["config"].isArray()) {
      throw std::invalid_argument("monitor entry needs a queue and a config array");
    }
    for (const Json::Value& dir : description["config"]) {
      if (!dir.isObject() || !dir["path"].isString() || dir["path"].asString().empty() ||
          !dir["mask"].isIntegral() || !dir["ignore"].isArray()) {
        throw std::invalid_argument("monitor entry has a malformed config element");
      }
      for (const Json::Value& name : dir["ignore"]) {
        if (!name.isString()) {
          throw std::invalid_argument("monitor entry ignores a name that is not a string");
        }
      }
    }
  }

  const Json::Value& Entry() const { return m_entry; }
  std::string QueuePath() const { return m_entry["queue"].asString(); }

  // Creates or replaces the registration of `client` for the entry's queue. From then on the
  // monitor appends the events under each directory of the entry (minus the ignored names) to the
  // queue. Returns true on success, false with the platform's last error set on failure; the
  // previous registration then stays as it was.
  static bool Upsert(const MonitorQueue& entry, const std::string& client, QueueType type);

  // Removes the registration of `client` for the queue `queuePath`; the monitor stops writing to
  // it. A registration that does not exist counts as removed. Returns true on success, false with
  // the platform's last error set on failure.
  static bool Delete(const std::string& queuePath, const std::string& client, QueueType type);

 private:
  Json::Value m_entry;
};

}  // namespace WEZOTIFYD
}  // namespace WEZO

#endif  // WEZO_WEZOTIFYD_H_

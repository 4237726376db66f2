#pragma once

#include "platform/QVLog.h"
#include "platform/QVValue.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <map>
#include <string>

// Configuration files that are read afresh each time they are needed: one JSON object each. A file
// that cannot be read or is no object counts as empty; an error line on the default log names file,
// line and column, once for as long as the reason stays the same. While only descriptors or memory
// are short, what was last read of a file holds: what is switched off is not to come on for that.
//
// Used by the adapters that answer from such files. Threads: any. The log outlives it.
class QVJSONConfiguration {
 public:
  // `contents` says in the log what the files hold.
  QVJSONConfiguration(QVLog& log, std::string contents);

  // The file's object; absent where there is no such file. `site` is the asking operation's.
  QVDictionary read(const std::string& path, const QVLogSite& site);

 private:
  // What is known of a file that is there.
  struct File {
    QVDictionary values = QVDictionary::assemble({});  // as they were last read
    std::string reported;                              // what was last logged of it
  };

  QVDictionary read(const std::string& path, std::string& complaint);

  QVLog& log_;
  const std::string contents_;

  QVMutex mutex_;
  std::map<std::string, File> files_ QV_GUARDED_BY(mutex_);  // by path
};

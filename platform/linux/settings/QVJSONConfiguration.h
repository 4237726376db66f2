#pragma once

#include "platform/QVLog.h"
#include "platform/QVValue.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <map>
#include <string>

// Configuration files that are read afresh each time they are needed: one JSON object each. A file
// that cannot be read or is no object counts as empty; an error line on the default log names file,
// line and column, once for as long as the reason stays the same.
//
// Used by the adapters that answer from such files. Threads: any. The log outlives it.
class QVJSONConfiguration {
 public:
  // `contents` says in the log what the files hold.
  QVJSONConfiguration(QVLog& log, std::string contents);

  // The file's object; absent where there is no such file. `site` is the asking operation's.
  QVDictionary read(const std::string& path, const QVLogSite& site);

 private:
  void report(const std::string& path, const std::string& reason, const QVLogSite& site);
  void forgetReport(const std::string& path);

  QVLog& log_;
  const std::string contents_;

  QVMutex mutex_;
  // What was last logged of a file, by its path.
  std::map<std::string, std::string> reported_ QV_GUARDED_BY(mutex_);
};

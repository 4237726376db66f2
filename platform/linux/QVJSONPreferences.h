#pragma once

#include "platform/QVLog.h"
#include "platform/QVPreferences.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <map>
#include <string>

// Preferences in files: DIRECTORY/DOMAIN.json holds a domain as one JSON object, and is read afresh
// at each call. "/" and NUL in a domain's name stand as "_" in the file's.
//
// A file that is not there is no domain. One that cannot be read or is no object counts as empty;
// an error line on the default log names file, line and column, once for as long as the reason
// stays the same.
//
// Threads: any. The log outlives it.
class QVJSONPreferences : public QVPreferences {
 public:
  QVJSONPreferences(QVLog& log, std::string directory);

  QVDictionary valuesInDomain(std::string_view domain) override;

 private:
  void report(const std::string& path, const std::string& reason);
  void forgetReport(const std::string& path);

  QVLog& log_;
  const std::string directory_;

  QVMutex mutex_;
  // What was last logged of a file, by its path.
  std::map<std::string, std::string> reported_ QV_GUARDED_BY(mutex_);
};

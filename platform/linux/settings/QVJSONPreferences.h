#pragma once

#include "platform/QVLog.h"
#include "platform/QVPreferences.h"
#include "platform/linux/settings/QVJSONConfiguration.h"

#include <string>

// Preferences in files: DIRECTORY/DOMAIN.json holds a domain as one JSON object, and is read afresh
// at each call. "/" and NUL in a domain's name stand as "_" in the file's.
//
// A file that is not there is no domain; one that cannot be read is an empty one, but where
// descriptors or memory are short, what was last read of it holds.
//
// Threads: any. The log outlives it.
class QVJSONPreferences : public QVPreferences {
 public:
  QVJSONPreferences(QVLog& log, std::string directory);

  QVDictionary valuesInDomain(std::string_view domain) override;

 private:
  QVJSONConfiguration files_;
  const std::string directory_;
};

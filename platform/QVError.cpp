#include "platform/QVError.h"

#include "platform/QVText.h"

std::string QVError::description() const {
  if (const QVValue* reason = userInfo.find(kFailureReason)) return QVText(*reason);
  return QVText(domain, " error ", code);
}

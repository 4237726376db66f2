#include "platform/linux/queues/QVRunWorkItem.h"

#include "platform/linux/QVLogException.h"

void QVRunWorkItem(QVWorkItem& item, std::string_view label, QVLog& log) noexcept {
  try {
    item();
  } catch (...) {
    QVLogException(log, __func__, "work queue", label);
  }
  item = nullptr;
}

#include "platform/linux/QVRunWorkItem.h"

#include <exception>

void QVRunWorkItem(QVWorkItem& item, std::string_view label, QVLog& log) noexcept {
  try {
    item();
  } catch (const std::exception& exception) {
    log.error(nullptr, __func__, "exception in work queue ", label, ": ", exception.what());
  } catch (...) {
    log.error(nullptr, __func__, "exception in work queue ", label, ": of unknown type");
  }
  item = nullptr;
}

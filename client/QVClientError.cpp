#include "client/QVClientError.h"

QVClientError QVClientError::refusal(std::string name, std::string text) {
  QVClientError error(Code::refused, std::move(text));
  error.domain_ = std::move(name);
  return error;
}

QVClientError QVClientError::ofService(std::string domain, int64_t serviceCode, std::string text) {
  QVClientError error(Code::serviceError, std::move(text));
  error.domain_ = std::move(domain);
  error.serviceCode_ = serviceCode;
  return error;
}

#include "platform/fake/QVFakeLog.h"

std::string QVFakeLog::Line::rendering() const {
  return QVText(static_cast<int>(level), '[', scope, "] ", function, ": ", text);
}

QVLogScope* QVFakeLog::registerScope(bool enabled, uint32_t code, std::string_view name,
                                     std::string_view domain, std::string_view verboseKey,
                                     int32_t registration) {
  const std::lock_guard lock(mutex_);
  registrations_.push_back({enabled, code, std::string(name), std::string(domain),
                            std::string(verboseKey), registration});
  auto& scope = scopes_[std::string(name)];
  if (scope == nullptr) {
    scope = std::make_unique<QVLogScope>();
    scope->name = name;
    scope->code = code;
    scope->subsystem = domain;
  }
  const auto verbose = verboseSwitches_.find(verboseKey);
  scope->verbose = verbose != verboseSwitches_.end() && verbose->second;
  return scope.get();
}

void QVFakeLog::write(const QVLogScope* scope, QVLogLevel level, const QVLogSite& site,
                      std::string text) {
  const std::string_view path = site.file;
  const std::lock_guard lock(mutex_);
  lines_.push_back({level, scope == nullptr ? std::string(kDefaultScope) : scope->name,
                    site.function, std::move(text), std::string(path.substr(path.rfind('/') + 1)),
                    site.line});
}

void QVFakeLog::setVerbose(std::string_view verboseKey, bool verbose) {
  const std::lock_guard lock(mutex_);
  verboseSwitches_[std::string(verboseKey)] = verbose;
}

std::vector<QVFakeLog::Line> QVFakeLog::lines() const {
  const std::lock_guard lock(mutex_);
  return lines_;
}

std::vector<QVFakeLog::Line> QVFakeLog::linesOfScope(std::string_view scope) const {
  auto selected = lines();
  std::erase_if(selected, [scope](const Line& line) { return line.scope != scope; });
  return selected;
}

std::vector<std::string> QVFakeLog::renderings() const {
  std::vector<std::string> texts;
  for (const Line& line : lines()) texts.push_back(line.rendering());
  return texts;
}

std::vector<std::string> QVFakeLog::renderingsOfScope(std::string_view scope) const {
  std::vector<std::string> texts;
  for (const Line& line : linesOfScope(scope)) texts.push_back(line.rendering());
  return texts;
}

std::vector<QVFakeLog::Registration> QVFakeLog::registrations() const {
  const std::lock_guard lock(mutex_);
  return registrations_;
}

void QVFakeLog::clear() {
  const std::lock_guard lock(mutex_);
  lines_.clear();
}

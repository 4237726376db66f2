#include "platform/fake/QVFakeFileSystem.h"

#include <utility>

namespace {

constexpr uint32_t kTreePermissions = 0755;

QVError makeError(const std::string& path, std::errc reason) {
  const std::error_code code = std::make_error_code(reason);
  std::string text = path;
  text.append(": ").append(code.message());
  return {.domain = "net.quillon.posix",
          .code = code.value(),
          .userInfo = {{QVError::kFailureReason, text}}};
}

std::string parentOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  return slash == 0 || slash == std::string::npos ? "/" : path.substr(0, slash);
}

bool namesAPlace(const std::string& path) {
  return path.size() > 1 && path.front() == '/' && path.back() != '/' &&
         path.find("//") == std::string::npos;
}

}  // namespace

class QVFakeFileSystem::File final : public QVAtomicFile {
 public:
  File(std::shared_ptr<State> state, std::string path)
      : state_(std::move(state)), path_(std::move(path)) {
    const std::lock_guard lock(state_->mutex);
    ++state_->openFiles;
    failure_ = state_->failure(Step::open);
    if (!failure_) failure_ = state_->obstacle(parentOf(path_));
  }
  ~File() override {
    const std::lock_guard lock(state_->mutex);
    if (!ended_) --state_->openFiles;
  }
  File(const File&) = delete;
  File& operator=(const File&) = delete;

  void write(std::string_view bytes) override {
    const std::lock_guard lock(state_->mutex);
    if (ended_) state_->misuse.note("written after its end: " + path_);
    if (!failure_) failure_ = state_->failure(Step::write, contents_.size() + bytes.size());
    if (!failure_) contents_.append(bytes);
  }

  std::optional<QVError> commit() override {
    const std::lock_guard lock(state_->mutex);
    if (std::exchange(ended_, true)) {
      state_->misuse.note("committed twice: " + path_);
    } else {
      --state_->openFiles;
      if (!failure_) failure_ = state_->failure(Step::rename);
      if (!failure_) failure_ = state_->replace(path_, std::move(contents_));
    }
    if (!failure_) return std::nullopt;
    return makeError(path_, *failure_);
  }

 private:
  const std::shared_ptr<State> state_;
  const std::string path_;
  std::string contents_;
  std::optional<std::errc> failure_;
  bool ended_ = false;
};

QVFakeFileSystem::QVFakeFileSystem() : state_(std::make_shared<State>()) {
  state_->nodes["/"].permissions = kTreePermissions;
}

std::optional<QVError> QVFakeFileSystem::createDirectory(const std::string& path,
                                                         uint32_t permissions) {
  const std::lock_guard lock(state_->mutex);
  if (!namesAPlace(path)) state_->misuse.note("no place for a directory: " + path);
  for (std::size_t end = path.find('/', 1);; end = path.find('/', end + 1)) {
    const std::string part = path.substr(0, end);
    if (state_->obstacle(part) == std::errc::no_such_file_or_directory) {
      const auto failure = state_->failure(Step::createDirectory);
      if (failure) return makeError(part, *failure);
      state_->nodes[part].permissions = permissions;
    }
    if (const auto obstacle = state_->obstacle(part)) return makeError(part, *obstacle);
    if (end == std::string::npos) return std::nullopt;
  }
}

std::unique_ptr<QVAtomicFile> QVFakeFileSystem::makeAtomicFile(const std::string& path) {
  if (!namesAPlace(path)) state_->misuse.note("no place for a file: " + path);
  return std::make_unique<File>(state_, path);
}

void QVFakeFileSystem::fail(Step step, std::errc reason, std::size_t bytes) {
  const std::lock_guard lock(state_->mutex);
  state_->failures.insert_or_assign(step, std::pair(reason, bytes));
}

void QVFakeFileSystem::recover(Step step) {
  const std::lock_guard lock(state_->mutex);
  state_->failures.erase(step);
}

void QVFakeFileSystem::addFile(const std::string& path, std::string contents) {
  const std::lock_guard lock(state_->mutex);
  if (state_->replace(path, std::move(contents))) {
    state_->misuse.note("no place for a file: " + path);
  }
}

void QVFakeFileSystem::addLink(const std::string& path) {
  const std::lock_guard lock(state_->mutex);
  state_->nodes[path] = {.isLink = true};
}

std::vector<std::string> QVFakeFileSystem::files() const {
  const std::lock_guard lock(state_->mutex);
  std::vector<std::string> paths;
  for (const auto& [path, node] : state_->nodes) {
    if (node.isFile()) paths.push_back(path);
  }
  return paths;
}

std::optional<std::string> QVFakeFileSystem::contents(const std::string& path) const {
  const std::lock_guard lock(state_->mutex);
  const auto found = state_->nodes.find(path);
  if (found == state_->nodes.end() || !found->second.isFile()) return std::nullopt;
  return found->second.contents;
}

std::optional<uint32_t> QVFakeFileSystem::permissions(const std::string& path) const {
  const std::lock_guard lock(state_->mutex);
  const auto found = state_->nodes.find(path);
  return found == state_->nodes.end() ? std::nullopt : found->second.permissions;
}

std::size_t QVFakeFileSystem::openFiles() const {
  const std::lock_guard lock(state_->mutex);
  return state_->openFiles;
}

std::optional<std::errc> QVFakeFileSystem::State::failure(Step step, std::size_t bytes) const {
  const auto found = failures.find(step);
  if (found == failures.end()) return std::nullopt;
  const auto& [reason, room] = found->second;
  if (step == Step::write && bytes <= room) return std::nullopt;
  return reason;
}

// What keeps the path from being a directory: that of a part above it, else its own.
std::optional<std::errc> QVFakeFileSystem::State::obstacle(const std::string& path) const {
  if (path.size() - path.rfind('/') - 1 > kMaximumNameBytes) return std::errc::filename_too_long;
  const auto found = nodes.find(path);
  if (found != nodes.end()) {
    if (found->second.permissions) return std::nullopt;
    return found->second.isLink ? std::errc::too_many_symbolic_link_levels
                                : std::errc::not_a_directory;
  }
  const auto above = obstacle(parentOf(path));
  return above ? above : std::errc::no_such_file_or_directory;
}

std::optional<std::errc> QVFakeFileSystem::State::replace(const std::string& path,
                                                          std::string contents) {
  const auto obstacle = this->obstacle(path);
  if (!obstacle) return std::errc::is_a_directory;
  const bool isFile = nodes.contains(path);
  if (!isFile &&
      (*obstacle != std::errc::no_such_file_or_directory || this->obstacle(parentOf(path)))) {
    return obstacle;
  }
  nodes[path] = {.contents = std::move(contents)};
  return std::nullopt;
}

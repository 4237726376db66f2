#include "platform/fake/QVFakePlatform.h"
#include "platform/linux/QVDescriptor.h"
#include "platform/linux/bus/QVBusAuthClient.h"
#include "platform/linux/bus/QVBusListener.h"
#include "platform/linux/bus/QVBusListeningSocket.h"
#include "tests/support/QVDescriptorLimit.h"
#include "tests/support/QVTestMessage.h"
#include "tests/unit/bus/QVRecordingService.h"

#include <array>
#include <atomic>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

// Only ends a wait that has failed.
constexpr timeval kDeadline{.tv_sec = 20, .tv_usec = 0};

sockaddr_un addressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, path.data(), path.size());
  return address;
}

// A client that waits for its answers.
class Client {
 public:
  Client() : descriptor_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    ::setsockopt(descriptor_, SOL_SOCKET, SO_RCVTIMEO, &kDeadline, sizeof kDeadline);
  }
  ~Client() { hangUp(); }
  Client(const Client&) = delete;
  Client& operator=(const Client&) = delete;

  // Connects; one that `speaks` asks to be let in at once.
  bool connect(const std::string& path, bool speaks = true) {
    const auto address = addressOf(path);
    if (::connect(descriptor_, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
      return false;
    }
    if (speaks) send(QVBusAuthClient::opening(::getuid()));
    return true;
  }
  void send(std::string_view bytes) {
    EXPECT_EQ(::send(descriptor_, bytes.data(), bytes.size(), MSG_NOSIGNAL),
              static_cast<ssize_t>(bytes.size()));
  }
  // Waits until that many bytes have come; fewer where the stream ends.
  std::string receive(std::size_t bytes) {
    std::string received(bytes, '\0');
    const ssize_t got = ::recv(descriptor_, received.data(), bytes, MSG_WAITALL);
    received.resize(got < 0 ? 0 : static_cast<std::size_t>(got));
    return received;
  }
  // Makes a call and waits for its answer, "b true".
  bool create(int64_t reporterID) {
    send(QVTestCall("CreateReportingSession", reporterID));
    return receive(kBooleanAnswer).size() == kBooleanAnswer;
  }
  bool isLetIn() { return receive(kLetIn).starts_with("OK "); }
  void hangUp() {
    if (descriptor_ >= 0) ::close(descriptor_);
    descriptor_ = -1;
  }

 private:
  static constexpr std::size_t kLetIn = 37;
  static constexpr std::size_t kBooleanAnswer = 36;
  int descriptor_;
};

class Delegate final : public QVIPCListenerDelegate {
 public:
  bool listener(QVIPCListener&, const std::shared_ptr<QVIPCConnection>& connection) override {
    if (!accepts) return false;
    if (throws) throw std::runtime_error("no memory");
    connection->setExportedInterface(QVIPCInterface::reportingService);
    connection->setExportedObject(std::make_shared<QVRecordingService>());
    connection->setInvalidationHandler([this] { ++invalidations; });
    connection->resume();
    return true;
  }
  std::atomic<bool> accepts{true};
  std::atomic<bool> throws{false};
  std::atomic<int> invalidations{0};
};

class QVBusListenerTest : public testing::Test {
 protected:
  QVBusListenerTest() {
    std::string name = (std::filesystem::temp_directory_path() / "qv-listener-XXXXXX").string();
    directory_ = ::mkdtemp(name.data());
    path_ = directory_ / "reporting.socket";
    // Where the listener tells that it is ready and that it ends.
    notify_ = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    ::setsockopt(notify_, SOL_SOCKET, SO_RCVTIMEO, &kDeadline, sizeof kDeadline);
    const auto notifyPath = (directory_ / "notify").string();
    const auto address = addressOf(notifyPath);
    EXPECT_EQ(::bind(notify_, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    ::setenv("NOTIFY_SOCKET", notifyPath.c_str(), 1);
  }
  ~QVBusListenerTest() override {
    if (thread_.joinable()) end();
    ::unsetenv("NOTIFY_SOCKET");
    ::close(notify_);
    std::filesystem::remove_all(directory_);
  }

  std::unique_ptr<QVBusListener> create(std::string& error) {
    return QVBusListener::create(
        {.socketPath = path_.string(), .drain = [this] { drained_ = true; }}, error);
  }
  void serve() {
    std::string error;
    listener_ = create(error);
    ASSERT_NE(listener_, nullptr) << error;
    listener_->setDelegate(delegate_);
    thread_ = std::thread([this] { listener_->resume(); });
    ASSERT_EQ(notification(), "READY=1");
  }
  void end(int signal = SIGTERM) {
    ::kill(::getpid(), signal);
    thread_.join();
  }
  std::string notification() {
    std::array<char, 256> text{};
    const ssize_t length = ::recv(notify_, text.data(), text.size(), 0);
    return {text.data(), length < 0 ? 0 : static_cast<std::size_t>(length)};
  }

  QVFakePlatform platform_;
  std::filesystem::path directory_;
  std::filesystem::path path_;
  int notify_ = -1;
  bool drained_ = false;
  std::shared_ptr<Delegate> delegate_ = std::make_shared<Delegate>();
  std::unique_ptr<QVBusListener> listener_;
  std::thread thread_;
};

}  // namespace

TEST_F(QVBusListenerTest, ServesClientsUntilTheServiceManagerEndsIt) {
  for (const int signal : {SIGTERM, SIGINT}) {
    serve();
    Client one, other;
    ASSERT_TRUE(one.connect(path_));
    ASSERT_TRUE(other.connect(path_));
    EXPECT_TRUE(one.isLetIn());
    EXPECT_TRUE(other.isLetIn());
    EXPECT_TRUE(one.create(1));
    EXPECT_TRUE(other.create(2));
    delegate_->invalidations = 0;
    drained_ = false;
    end(signal);
    EXPECT_EQ(delegate_->invalidations, 2);
    EXPECT_TRUE(drained_);
    EXPECT_EQ(one.receive(1), "");
    EXPECT_EQ(notification(), "STOPPING=1");
    EXPECT_FALSE(std::filesystem::exists(path_));
    listener_.reset();
  }
  EXPECT_TRUE(platform_.log().lines().empty());
}

TEST_F(QVBusListenerTest, MakesASocketForOwnerAndGroupAlone) {
  const mode_t mask = ::umask(0077);
  std::string error;
  const auto listener = create(error);
  ::umask(mask);
  ASSERT_NE(listener, nullptr) << error;
  struct stat status {};
  ASSERT_EQ(::lstat(path_.c_str(), &status), 0);
  EXPECT_TRUE(S_ISSOCK(status.st_mode));
  EXPECT_EQ(status.st_mode & 07777, 0660U);
}

TEST_F(QVBusListenerTest, LeavesARunningServicesSocketAlone) {
  serve();
  std::string error;
  EXPECT_EQ(create(error), nullptr);
  EXPECT_EQ(error, "a running service listens at " + path_.string());
  Client client;
  ASSERT_TRUE(client.connect(path_));
  EXPECT_TRUE(client.isLetIn());
}

TEST_F(QVBusListenerTest, ReplacesASocketThatADeadServiceLeft) {
  {
    const int dead = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    const auto address = addressOf(path_);
    ASSERT_EQ(::bind(dead, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    ::close(dead);
  }
  serve();
  Client client;
  ASSERT_TRUE(client.connect(path_));
  EXPECT_TRUE(client.isLetIn());
}

TEST_F(QVBusListenerTest, TouchesNothingThatIsNoSocket) {
  std::ofstream(path_) << "mine";
  std::string error;
  EXPECT_EQ(create(error), nullptr);
  EXPECT_EQ(error, path_.string() + " is no socket; it is left alone");
  EXPECT_EQ(std::filesystem::file_size(path_), 4U);
}

TEST_F(QVBusListenerTest, SaysWhatIsWrongWithThePath) {
  std::string error;
  path_ = directory_ / "missing" / "reporting.socket";
  EXPECT_EQ(create(error), nullptr);
  EXPECT_EQ(error, "cannot use the directory " + (directory_ / "missing").string() +
                       ": No such file or directory");
  path_ = "/" + std::string(200, 'x');
  EXPECT_EQ(create(error), nullptr);
  EXPECT_THAT(error, testing::HasSubstr("is empty or longer than 107 bytes"));
}

TEST_F(QVBusListenerTest, LeavesASocketThatTookItsPlace) {
  std::string error;
  auto listener = create(error);
  std::filesystem::remove(path_);
  auto successor = create(error);
  ASSERT_NE(successor, nullptr) << error;
  listener.reset();
  EXPECT_TRUE(std::filesystem::exists(path_));
  successor.reset();
  EXPECT_FALSE(std::filesystem::exists(path_));
}

TEST_F(QVBusListenerTest, ClosesWhatTheDelegateDoesNotAccept) {
  serve();
  delegate_->accepts = false;
  Client refused;
  ASSERT_TRUE(refused.connect(path_, false));
  EXPECT_EQ(refused.receive(1), "");
  delegate_->accepts = true;
  Client client;
  ASSERT_TRUE(client.connect(path_));
  EXPECT_TRUE(client.isLetIn());
}

TEST_F(QVBusListenerTest, ClosesWhatTheDelegateThrowsAt) {
  serve();
  delegate_->throws = true;
  Client unlucky;
  ASSERT_TRUE(unlucky.connect(path_, false));
  EXPECT_EQ(unlucky.receive(1), "");
  delegate_->throws = false;
  Client client;
  ASSERT_TRUE(client.connect(path_));
  EXPECT_TRUE(client.isLetIn());
  const auto lines = platform_.log().lines();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_EQ(lines[0].text, "exception in a new connection: no memory");
}

TEST_F(QVBusListenerTest, LetsClientsWaitWhileDescriptorsAreUsedUp) {
  serve();
  // So that the eighth is enough for those who need descriptors beside the listener.
  std::vector<QVDescriptor> others;
  for (int i = 0; i < 120; ++i) others.emplace_back(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  Client first, second;
  ASSERT_TRUE(first.connect(path_));
  ASSERT_TRUE(first.isLetIn());
  // The listener leaves an eighth unused.
  const QVDescriptorLimit noMore(QVDescriptorLimit::inUse() / 7);
  ASSERT_TRUE(second.connect(path_));
  // The first is served all the while; each call gives the listener a turn.
  for (int64_t call = 0; call < 1000 && platform_.log().lines().empty(); ++call) {
    ASSERT_TRUE(first.create(call));
  }
  for (int64_t call = 0; call < 100; ++call) ASSERT_TRUE(first.create(call));
  const auto lines = platform_.log().lines();
  ASSERT_EQ(lines.size(), 1U) << "it says so once";
  EXPECT_EQ(lines[0].level, QVLogLevel::error);
  EXPECT_EQ(lines[0].text,
            "cannot accept a connection: Too many open files; clients wait until one closes");
  first.hangUp();
  EXPECT_TRUE(second.isLetIn());
}

namespace {

// Puts a descriptor where the service manager puts its socket, as far as this process can tell.
class Inheritance {
 public:
  Inheritance(int descriptor, const char* count) : saved_(::dup(kPlace)) {
    ::dup2(descriptor, kPlace);
    ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
    ::setenv("LISTEN_FDS", count, 1);
  }
  ~Inheritance() {
    if (saved_ >= 0) {
      ::dup2(saved_, kPlace);
      ::close(saved_);
    } else {
      ::close(kPlace);
    }
  }
  Inheritance(const Inheritance&) = delete;
  Inheritance& operator=(const Inheritance&) = delete;

 private:
  static constexpr int kPlace = 3;
  int saved_;
};

}  // namespace

TEST_F(QVBusListenerTest, TakesTheServiceManagersSocketAndLeavesItInItsPlace) {
  const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const auto address = addressOf(path_);
  ASSERT_EQ(::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  ASSERT_EQ(::listen(socket, 5), 0);
  // The client was there first.
  Client client;
  ASSERT_TRUE(client.connect(path_));
  {
    const Inheritance inheritance(socket, "1");
    std::string error;
    const auto place = QVBusListeningSocket::open("/unused", error);
    ASSERT_NE(place, nullptr) << error;
    const int accepted =
        ::accept4(place->takeDescriptor(), nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC);
    EXPECT_GE(accepted, 0);
    ::close(accepted);
    place->unlink();
  }
  EXPECT_EQ(::getenv("LISTEN_FDS"), nullptr);
  EXPECT_TRUE(std::filesystem::exists(path_));
  ::close(socket);
}

TEST_F(QVBusListenerTest, TakesNothingElseFromTheServiceManager) {
  std::string error;
  const int datagram = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  {
    const Inheritance inheritance(datagram, "1");
    EXPECT_EQ(create(error), nullptr);
    EXPECT_EQ(error, "the service manager's socket is no listening unix stream socket");
  }
  const int notListening = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  {
    const Inheritance inheritance(notListening, "1");
    EXPECT_EQ(create(error), nullptr);
    EXPECT_EQ(error, "the service manager's socket is no listening unix stream socket");
  }
  ::close(datagram);
  ::close(notListening);
}

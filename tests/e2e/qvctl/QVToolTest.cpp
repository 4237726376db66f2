#include "tests/e2e/qvctl/QVToolTest.h"

#include "platform/linux/files/QVJSONFile.h"

#include <fstream>
#include <iterator>
#include <sstream>

#include <sys/socket.h>
#include <unistd.h>

namespace {

std::string contents(const std::filesystem::path& file) {
  std::ifstream stream(file);
  return {std::istreambuf_iterator<char>(stream), {}};
}

}  // namespace

QVToolTest::Arguments QVToolTest::command(const Arguments& arguments) {
  Arguments command{QVDaemonProcess::program("qvctl").string()};
  command.insert(command.end(), arguments.begin(), arguments.end());
  return command;
}

std::map<std::string, std::string> QVToolTest::environment() const {
  auto environment = QVDaemonProcess::environment(root_);
  environment.erase("NOTIFY_SOCKET");
  environment["QUIETVOX_SOCKET"] = root_.socket();
  environment["TZ"] = "UTC";
  return environment;
}

QVToolTest::Output QVToolTest::qvctl(const Arguments& arguments, const Arguments& wrapper) const {
  const auto out = root_.path() / "out";
  const auto error = root_.path() / "error";
  std::filesystem::remove(out);
  std::filesystem::remove(error);
  Arguments whole = wrapper;
  const Arguments tool = command(arguments);
  whole.insert(whole.end(), tool.begin(), tool.end());
  QVSubprocess process({.arguments = whole,
                        .environment = environment(),
                        .standardOutputFile = out,
                        .standardErrorFile = error});
  const auto status = process.wait(std::chrono::seconds(60));
  EXPECT_TRUE(status.has_value()) << "qvctl does not end";
  return {status.value_or(-1), contents(out), contents(error)};
}

std::string QVToolTest::run(const Arguments& arguments) const {
  const Output output = qvctl(arguments);
  EXPECT_EQ(output.status, 0) << testing::PrintToString(arguments) << output.error;
  EXPECT_EQ(output.error, "");
  return output.out;
}

std::vector<QVValue> QVToolTest::parseLines(const std::string& text) {
  std::vector<QVValue> values;
  std::istringstream stream(text);
  for (std::string line; std::getline(stream, line);) {
    QVJSONFailure failure;
    const auto value = QVJSONFile::parse(line, failure);
    EXPECT_TRUE(value.has_value()) << failure.description() << " in " << line;
    values.push_back(value.value_or(QVValue()));
  }
  return values;
}

std::vector<QVValue> QVToolTest::jsonLines(Arguments arguments) const {
  arguments.emplace_back("--json");
  return parseLines(run(arguments));
}

QVValue QVToolTest::json(Arguments arguments) const {
  const std::vector<QVValue> values = jsonLines(std::move(arguments));
  EXPECT_EQ(values.size(), 1U);
  return values.empty() ? QVValue() : values[0];
}

std::unique_ptr<QVTerminal> QVToolTest::terminal(
    const Arguments& arguments, const std::map<std::string, std::string>& more) const {
  auto all = environment();
  all["TERM"] = "xterm";
  all["LC_ALL"] = "C.UTF-8";
  for (const auto& [name, value] : more) all[name] = value;
  return std::make_unique<QVTerminal>(
      QVTerminal::Options{.arguments = command(arguments), .environment = all, .columns = 160});
}

std::string QVToolTest::show(const Arguments& arguments,
                             const std::map<std::string, std::string>& more) const {
  const auto shown = terminal(arguments, more);
  EXPECT_EQ(shown->wait(), 0) << testing::PrintToString(arguments) << shown->shown();
  return shown->shown();
}

QVValue QVToolTest::at(const QVValue& value, const std::vector<std::string>& keys) {
  QVValue found = value;
  for (const std::string& key : keys) {
    if (found.kind() != QVValue::Kind::dictionary) return {};
    const QVDictionary entries = found.dictionary();
    const QVValue* const next = entries.find(key);
    found = next == nullptr ? QVValue() : QVValue(*next);
  }
  return found;
}

QVToolTest::Arguments QVToolTest::withoutPrivilege() {
  if (::getuid() != 0) return {};
  return {"setpriv", "--bounding-set=-dac_override,-dac_read_search", "--inh-caps=-all"};
}

sockaddr_un QVToolTest::socketAddress() const {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  root_.socket().string().copy(address.sun_path, sizeof address.sun_path - 1);
  return address;
}

int QVToolTest::listenInstead() const {
  const sockaddr_un address = socketAddress();
  const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  EXPECT_EQ(::bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  EXPECT_EQ(::listen(listener, 16), 0);
  return listener;
}

QVToolTest::Connection QVToolTest::connectTo(int listener) const {
  const sockaddr_un address = socketAddress();
  Connection connection{.client = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)};
  EXPECT_EQ(
      ::connect(connection.client, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  connection.accepted = ::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
  EXPECT_GE(connection.accepted, 0);
  return connection;
}

QVPeerClient& QVToolTest::client() {
  service();
  return client_ ? *client_ : client_.emplace(root_.socket());
}

void QVToolTest::startSession(int64_t reporterID, uint16_t serviceType,
                              const QVDictionary& configuration) {
  client().create(reporterID, serviceType);
  if (!configuration.empty()) client().configure(configuration, reporterID);
  client().start(reporterID);
}

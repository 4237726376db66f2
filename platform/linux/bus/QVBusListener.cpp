#include "platform/linux/bus/QVBusListener.h"

#include "platform/QVPlatform.h"
#include "platform/linux/QVLogException.h"
#include "platform/linux/bus/QVBusConnection.h"
#include "platform/linux/bus/QVBusListeningSocket.h"
#include "platform/linux/bus/QVBusLoop.h"
#include "platform/linux/bus/QVBusServer.h"
#include "platform/linux/bus/QVBusSocket.h"

#include <cerrno>
#include <chrono>
#include <csignal>
#include <exception>
#include <system_error>
#include <utility>

#include <asio/io_context.hpp>
#include <asio/signal_set.hpp>
#include <asio/steady_timer.hpp>
#include <systemd/sd-daemon.h>
#include <unistd.h>

namespace {

// Connections accepted in one go before those that are open get their turn.
constexpr int kMostAcceptedAtOnce = 64;

// After descriptors ran out: they may be used up by others than our connections.
constexpr auto kAcceptAgainAfter = std::chrono::seconds(1);

}  // namespace

// Members in the order of their dependence: what waits on the loop goes before the loop.
struct QVBusListener::Inside {
  QVBusLoop loop;
  QVBusServer server{loop};
  QVBusListenerOptions options;
  std::unique_ptr<QVBusListeningSocket> place;
  QVBusSocket listening;
  asio::signal_set signals{loop.context()};
  asio::steady_timer acceptAgain{loop.context()};
  std::weak_ptr<QVIPCListenerDelegate> delegate;
  bool waits = false;             // for a client
  bool outOfDescriptors = false;  // does not wait, and has said so
  bool ending = false;

  Inside(QVBusListenerOptions given, std::unique_ptr<QVBusListeningSocket> socket)
      : options(std::move(given)),
        place(std::move(socket)),
        listening(loop, place->takeDescriptor()) {}
};

std::unique_ptr<QVBusListener> QVBusListener::create(QVBusListenerOptions options,
                                                     std::string& error) {
  auto place = QVBusListeningSocket::open(options.socketPath, error);
  if (place == nullptr) return nullptr;
  return std::unique_ptr<QVBusListener>(
      new QVBusListener(std::make_unique<Inside>(std::move(options), std::move(place))));
}

QVBusListener::QVBusListener(std::unique_ptr<Inside> inside) : inside_(std::move(inside)) {}

QVBusListener::~QVBusListener() {
  inside_->server.setClosedHandler(nullptr);
  inside_->place->unlink();
}

void QVBusListener::setDelegate(std::weak_ptr<QVIPCListenerDelegate> delegate) {
  inside_->delegate = std::move(delegate);
}

void QVBusListener::resume() {
  std::signal(SIGPIPE, SIG_IGN);
  inside_->signals.add(SIGTERM);
  inside_->signals.add(SIGINT);
  inside_->signals.async_wait([this](const asio::error_code& error, int) {
    if (!error) inside_->loop.stop();
  });
  inside_->server.setClosedHandler([this] { acceptWhenReadable(); });
  inside_->server.setAfterCalls(std::move(inside_->options.afterCalls));
  // From here on they end the service in good order; before, the composition root holds them back.
  sigset_t ends;
  ::sigemptyset(&ends);
  ::sigaddset(&ends, SIGTERM);
  ::sigaddset(&ends, SIGINT);
  ::pthread_sigmask(SIG_UNBLOCK, &ends, nullptr);
  acceptWhenReadable();
  ::sd_notify(0, "READY=1");
  runLoop();
  endService();
}

// What escapes is want of memory: the loop goes on.
void QVBusListener::runLoop() {
  for (;;) {
    try {
      inside_->loop.run();
      return;
    } catch (const std::exception&) {
      QVLogException(*QVPlatform::shared().log, "-[QVBusListener resume]", "the IPC thread");
    }
  }
}

void QVBusListener::endService() {
  inside_->ending = true;
  inside_->listening.close();
  inside_->place->unlink();
  ::sd_notify(0, "STOPPING=1");
  inside_->server.readToTheEnd();
  inside_->server.invalidateAll();
  inside_->server.awaitEnds();
  if (inside_->options.drain) inside_->options.drain();
}

void QVBusListener::acceptWhenReadable() {
  if (inside_->waits || inside_->ending) return;
  inside_->listening.waitReadable([this] {
    inside_->waits = false;
    acceptAll();
  });
  inside_->waits = true;
}

void QVBusListener::acceptAll() {
  for (int accepted = 0; accepted < kMostAcceptedAtOnce; ++accepted) {
    const int descriptor = inside_->listening.accept();
    if (descriptor < 0) {
      switch (-descriptor) {
        case EAGAIN:
        case EINTR:
        case ECONNABORTED:
          break;
        default:
          acceptLater(-descriptor);
          return;
      }
      break;
    }
    inside_->outOfDescriptors = false;
    serve(descriptor);
  }
  acceptWhenReadable();
}

// What the set-up throws, want of memory above all, is the end of this connection alone.
void QVBusListener::serve(int descriptor) noexcept {
  std::shared_ptr<QVBusConnection> connection;
  try {
    connection = inside_->server.adopt(descriptor);
    const auto delegate = inside_->delegate.lock();
    if (delegate != nullptr && delegate->listener(*this, connection)) return;
  } catch (...) {
    QVLogException(*QVPlatform::shared().log, "-[QVBusListener serve:]", "a new connection");
  }
  if (connection != nullptr) connection->invalidate();
}

// The client that waits would be announced again and again: so nothing is accepted until a
// connection closes, or some time has passed.
void QVBusListener::acceptLater(int error) {
  if (!std::exchange(inside_->outOfDescriptors, true)) {
    QVPlatform::shared().log->error(
        nullptr, "-[QVBusListener acceptLater:]",
        "cannot accept a connection: ", std::generic_category().message(error),
        "; clients wait until one closes");
  }
  inside_->acceptAgain.expires_after(kAcceptAgainAfter);
  inside_->acceptAgain.async_wait([this](const asio::error_code& cancelled) {
    if (!cancelled) acceptWhenReadable();
  });
}

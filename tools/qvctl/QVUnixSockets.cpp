#include "tools/qvctl/QVUnixSockets.h"

#include "platform/linux/QVDescriptor.h"

#include <array>
#include <cerrno>
#include <cstring>

#include <linux/netlink.h>
#include <linux/rtnetlink.h>
#include <linux/sock_diag.h>
#include <linux/unix_diag.h>
#include <sys/socket.h>
#include <sys/sysmacros.h>

namespace {

// States of sockets, as the kernel numbers them.
constexpr unsigned kEstablished = 1;
constexpr unsigned kListen = 10;

// The kernel's own number of a device has 20 bits for its minor part.
constexpr unsigned kMinorBits = 20;

// Bytes of one answer, which holds many sockets; the kernel never makes longer ones.
constexpr std::size_t kAnswerBytes = 32768;

bool ask(int netlink) {
  struct {
    nlmsghdr header;
    unix_diag_req request;
  } question{};
  question.header.nlmsg_len = sizeof question;
  question.header.nlmsg_type = SOCK_DIAG_BY_FAMILY;
  question.header.nlmsg_flags = NLM_F_REQUEST | NLM_F_DUMP;
  question.request.sdiag_family = AF_UNIX;
  question.request.udiag_states = 1U << kEstablished | 1U << kListen;
  question.request.udiag_show = UDIAG_SHOW_VFS | UDIAG_SHOW_PEER;
  sockaddr_nl kernel{};
  kernel.nl_family = AF_NETLINK;
  return ::sendto(netlink, &question, sizeof question, 0,
                  reinterpret_cast<const sockaddr*>(&kernel), sizeof kernel) == sizeof question;
}

QVUnixSocket socketOf(const nlmsghdr& header) {
  const auto& message = *static_cast<const unix_diag_msg*>(NLMSG_DATA(&header));
  QVUnixSocket socket;
  socket.inode = message.udiag_ino;
  socket.isListening = message.udiag_state == kListen;
  const auto* attribute = reinterpret_cast<const rtattr*>(&message + 1);
  auto left = static_cast<unsigned>(header.nlmsg_len - NLMSG_LENGTH(sizeof message));
  for (; RTA_OK(attribute, left); attribute = RTA_NEXT(attribute, left)) {
    if (attribute->rta_type == UNIX_DIAG_PEER) {
      std::memcpy(&socket.peer, RTA_DATA(attribute), sizeof socket.peer);
    } else if (attribute->rta_type == UNIX_DIAG_VFS) {
      unix_diag_vfs file{};
      std::memcpy(&file, RTA_DATA(attribute), sizeof file);
      socket.fileInode = file.udiag_vfs_ino;
      socket.fileDevice = ::makedev(file.udiag_vfs_dev >> kMinorBits,
                                    file.udiag_vfs_dev & ((1U << kMinorBits) - 1));
    }
  }
  return socket;
}

// Takes the sockets of one answer; false where it was the last one.
bool takeAnswer(const char* bytes, std::size_t count, std::vector<QVUnixSocket>& sockets,
                bool& failed) {
  auto left = static_cast<unsigned>(count);
  const auto* header = reinterpret_cast<const nlmsghdr*>(bytes);
  for (; NLMSG_OK(header, left); header = NLMSG_NEXT(header, left)) {
    if (header->nlmsg_type == NLMSG_DONE) return false;
    if (header->nlmsg_type == NLMSG_ERROR) {
      failed = true;
      return false;
    }
    if (header->nlmsg_type == SOCK_DIAG_BY_FAMILY) sockets.push_back(socketOf(*header));
  }
  return true;
}

}  // namespace

std::optional<std::vector<QVUnixSocket>> QVListUnixSockets() {
  const QVDescriptor netlink(::socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_SOCK_DIAG));
  if (!netlink.isOpen() || !ask(netlink.get())) return std::nullopt;
  std::vector<QVUnixSocket> sockets;
  alignas(nlmsghdr) std::array<char, kAnswerBytes> answer;
  bool failed = false;
  bool goesOn = true;
  while (goesOn) {
    const ssize_t count = ::recv(netlink.get(), answer.data(), answer.size(), 0);
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return std::nullopt;
    goesOn = takeAnswer(answer.data(), static_cast<std::size_t>(count), sockets, failed);
  }
  if (failed) return std::nullopt;
  return sockets;
}

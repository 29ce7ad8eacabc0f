// Thread safety: confined to the thread that made it.
//
// The handshake that opens a D-Bus connection ("Authentication Protocol" of the D-Bus
// specification, mechanism EXTERNAL), read to the byte. sd-bus could do it, but it reads ahead
// while it does, and so might hold the beginning of a message of any size before anybody has judged
// it.
#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

namespace spacekeep::ipc {

class Authentication {
 public:
  enum class Role { kServer, kClient };
  enum class Progress { kMore, kDone, kFailed, kLeft };

  /// Does not take over `fd`, a non-blocking stream socket. `peer_uid` is what the kernel says of
  /// the peer; a server takes no other claim.
  Authentication(Role role, int fd, uid_t peer_uid);

  /// A client has to speak first. False when the peer is gone.
  bool begin();
  /// Whenever there may be something to read. kFailed says in `why` what was wrong, kLeft that the
  /// peer is gone.
  Progress advance(std::string& why);

 private:
  enum class Read { kLine, kNothing, kLeft, kWrong };
  enum class State { kNul, kStart, kData, kAuthenticated };

  Read readLine(std::string& why);
  bool send(std::string_view text);
  Progress serve(std::string_view line, std::string& why);
  Progress answerAuth(std::string_view argument, std::string& why);
  Progress accept(std::string_view token, std::string& why);
  Progress reject(std::string& why);
  Progress follow(std::string_view line, std::string& why);
  Progress sent(bool whole, std::string& why);

  const Role role_;
  const int fd_;
  const uid_t peer_uid_;
  State state_;
  unsigned lines_ = 0;
  std::string line_;
};

}  // namespace spacekeep::ipc

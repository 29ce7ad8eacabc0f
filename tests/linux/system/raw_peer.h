// Thread safety: one test at a time.
//
// A peer that knows the bytes of the wire and none of its manners.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace spacekeep::system_test {

class RawPeer {
 public:
  explicit RawPeer(const std::string& socket_path);
  RawPeer(RawPeer&& other) noexcept;
  RawPeer& operator=(RawPeer&&) = delete;
  ~RawPeer();

  [[nodiscard]] bool connected() const { return fd_ >= 0; }
  /// Sends what fits without waiting for long; answers how much went out.
  std::size_t send(std::string_view bytes) const;
  /// The usual handshake up to BEGIN, its answers read.
  void authenticate() const;
  /// True once the other end has closed, within a few seconds.
  [[nodiscard]] bool closedByPeer() const;
  /// What arrives next; empty when nothing does within two seconds, or the other end has closed.
  [[nodiscard]] std::string receive() const;

 private:
  int fd_ = -1;
};

/// A method call as bytes. `body` is marshalled already; `sender` forges that header field.
[[nodiscard]] std::string methodCall(std::string_view member, std::string_view signature,
                                     std::string_view body, std::string_view sender = {});
/// The same header, with another length of the body claimed.
[[nodiscard]] std::string callClaiming(std::string_view member, std::string_view signature,
                                       std::uint32_t body_length);
/// A body of type a{sv} with one entry whose value nests variants this deep.
[[nodiscard]] std::string nestedVariants(int depth);

}  // namespace spacekeep::system_test

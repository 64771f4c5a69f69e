#pragma once

#include <array>
#include <compare>
#include <cstddef>
#include <cstdint>
#include <string>

namespace tessel::utility {

// A 128-bit identity. Its bytes stand in the order of the text form and are the same on every
// machine.
class Guid {
 public:
  using Bytes = std::array<std::uint8_t, 16>;

  Guid() = default;  // nil
  explicit Guid(const Bytes& bytes) : bytes_(bytes) {}

  // Random; no other call, in any process, gives the same.
  static Guid MakeUnique();
  // The Guid that the text tells ("01234567-89ab-cdef-0123-456789abcdef", either case), or, for any
  // other text, a hash of its bytes.
  static Guid FromText(const std::string& text);
  // False if the text is no Guid; then `guid` stands unchanged.
  static bool Parse(const std::string& text, Guid* guid);

  bool IsNil() const { return *this == Guid(); }
  const Bytes& bytes() const { return bytes_; }
  std::string ToText() const;  // lower case

  auto operator<=>(const Guid&) const = default;

 private:
  Bytes bytes_{};
};

// The state after the piece is mixed into it. Depends on the state, the bytes, and where one piece
// ends and the next begins. Stored identities are made by it: its results must never change.
Guid MixHash(const Guid& state, const void* data, std::size_t size);

}  // namespace tessel::utility

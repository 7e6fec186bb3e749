#include "extract/Protocol.h"

#include <cstring>

namespace extract {

namespace {

constexpr uint32_t kRequestMagic = 0x31515854;
constexpr uint32_t kReplyMagic = 0x31525854;

template <size_t N>
std::string bytesOf(const std::array<uint32_t, N>& words) {
  return {reinterpret_cast<const char*>(words.data()), sizeof words};
}

template <size_t N>
std::optional<std::array<uint32_t, N>> wordsOf(std::string_view bytes, uint32_t magic) {
  std::array<uint32_t, N> words;
  if (bytes.size() != sizeof words) return std::nullopt;
  std::memcpy(words.data(), bytes.data(), sizeof words);
  return words[0] == magic ? std::optional(words) : std::nullopt;
}

}  // namespace

void Counts::add(const Counts& other) {
  other.forEach([this](Kind kind, Outcome outcome, uint64_t count) { add(kind, outcome, count); });
}

std::string encode(const Request& request) {
  return bytesOf(std::array{kRequestMagic, static_cast<uint32_t>(request.kind), request.limit});
}

std::string encode(const ReplyHeader& reply) {
  return bytesOf(std::array{kReplyMagic, static_cast<uint32_t>(reply.outcome),
                            static_cast<uint32_t>(reply.last), reply.size});
}

std::optional<Request> parseRequest(std::string_view bytes) {
  const auto words = wordsOf<kRequestBytes / 4>(bytes, kRequestMagic);
  if (!words) return std::nullopt;
  const auto [magic, kind, limit] = *words;
  const bool good =
      kind <= static_cast<uint32_t>(Kind::html) && limit > 0 && limit <= kMaxTextBytes;
  return good ? std::optional(Request{static_cast<Kind>(kind), limit}) : std::nullopt;
}

std::optional<ReplyHeader> parseReply(std::string_view bytes, uint32_t limit) {
  const auto words = wordsOf<kReplyBytes / 4>(bytes, kReplyMagic);
  if (!words) return std::nullopt;
  const auto [magic, outcome, last, size] = *words;
  const bool hasText = outcome <= static_cast<uint32_t>(Outcome::cut);
  const bool good = outcome <= static_cast<uint32_t>(Outcome::damaged) && last <= 1 &&
                    size <= limit && hasText == (size > 0);
  if (!good) return std::nullopt;
  return ReplyHeader{static_cast<Outcome>(outcome), last == 1, size};
}

}  // namespace extract

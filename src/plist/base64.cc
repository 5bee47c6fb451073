#include "plist/base64.h"

#include <array>
#include <cstdint>

namespace kolt::base64 {
namespace {

constexpr char kAlphabet[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

constexpr std::uint8_t kSpace = 0x40;
constexpr std::uint8_t kPad = 0x41;
constexpr std::uint8_t kBad = 0xFF;

constexpr std::array<std::uint8_t, 256> makeDecodeTable() {
  std::array<std::uint8_t, 256> t{};
  for (auto& v : t) v = kBad;
  for (std::uint8_t i = 0; i < 64; ++i) t[static_cast<unsigned char>(kAlphabet[i])] = i;
  t[' '] = t['\t'] = t['\r'] = t['\n'] = kSpace;
  t['='] = kPad;
  return t;
}

constexpr std::array<std::uint8_t, 256> kDecode = makeDecodeTable();

}  // namespace

void appendLines(std::string& out, std::string_view bytes, std::size_t indent) {
  constexpr std::size_t kLineBytes = kLineChars / 4 * 3;
  const auto* p = reinterpret_cast<const unsigned char*>(bytes.data());
  std::size_t left = bytes.size();
  while (left > 0) {
    const std::size_t take = left < kLineBytes ? left : kLineBytes;
    out.append(indent, '\t');
    const std::size_t start = out.size();
    out.resize(start + (take + 2) / 3 * 4);
    char* o = &out[start];
    std::size_t i = 0;
    for (; i + 3 <= take; i += 3) {
      const std::uint32_t v = (p[i] << 16) | (p[i + 1] << 8) | p[i + 2];
      *o++ = kAlphabet[v >> 18];
      *o++ = kAlphabet[(v >> 12) & 63];
      *o++ = kAlphabet[(v >> 6) & 63];
      *o++ = kAlphabet[v & 63];
    }
    if (i < take) {
      const std::uint32_t v = (p[i] << 16) | (i + 1 < take ? p[i + 1] << 8 : 0);
      *o++ = kAlphabet[v >> 18];
      *o++ = kAlphabet[(v >> 12) & 63];
      *o++ = i + 1 < take ? kAlphabet[(v >> 6) & 63] : '=';
      *o++ = '=';
    }
    out += '\n';
    p += take;
    left -= take;
  }
}

std::optional<std::string> decode(std::string_view text) {
  std::string out;
  out.reserve(text.size() / 4 * 3 + 3);
  std::uint32_t acc = 0;
  int sextets = 0;  // in the current quantum
  int pads = 0;
  for (const char ch : text) {
    const std::uint8_t v = kDecode[static_cast<unsigned char>(ch)];
    if (v < 64) {
      if (pads > 0) return std::nullopt;  // data after padding
      acc = (acc << 6) | v;
      if (++sextets == 4) {
        out += static_cast<char>(acc >> 16);
        out += static_cast<char>((acc >> 8) & 0xFF);
        out += static_cast<char>(acc & 0xFF);
        acc = 0;
        sextets = 0;
      }
    } else if (v == kPad) {
      // Padding completes a quantum of two or three sextets.
      if (sextets < 2 || sextets + pads >= 4) return std::nullopt;
      ++pads;
    } else if (v != kSpace) {
      return std::nullopt;
    }
  }
  if (pads > 0 && sextets + pads != 4) return std::nullopt;
  if (sextets == 1) return std::nullopt;
  if (sextets == 2) out += static_cast<char>(acc >> 4);
  if (sextets == 3) {
    out += static_cast<char>(acc >> 10);
    out += static_cast<char>((acc >> 2) & 0xFF);
  }
  return out;
}

}  // namespace kolt::base64

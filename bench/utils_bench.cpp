// SHA-256 and base64 of the string utilities against raw OpenSSL, side by side
// on the same 1 MiB of bytes (fixed pseudo-random bytes for base64, ASCII
// text for SHA-256, which hashes UTF-8 text only).
//
//   BM_Sha256/kivi            KivUtils::sha256Hash: UTF-8 check, digest, hex
//   BM_Sha256/openssl         EVP_Digest with EVP_sha256() into a buffer
//   BM_Base64Encode/kivi      base64::encode to a new std::string
//   BM_Base64Encode/openssl   EVP_EncodeBlock into a new std::string
//   BM_Base64Decode/kivi      base64::decode (strict) to a new Data
//   BM_Base64Decode/openssl   EVP_DecodeBlock into a new Data
//
// Every row allocates its output per iteration as the library call does, so
// the rows compare directly; bytes_per_second counts the input bytes, and
// each ratio is bytes_per_second(kivi) / bytes_per_second(openssl).
#include <benchmark/benchmark.h>
#include <openssl/evp.h>

#include <cstdint>
#include <random>
#include <string>

#include "kivi/text/base64.h"
#include "kivi/utils/kiv_utils.h"

namespace {

constexpr std::size_t kSize = 1u << 20;

const kivi::Data& randomBytes() {
  static const kivi::Data bytes = [] {
    std::mt19937 random(42);
    kivi::Data data(kSize);
    for (auto& byte : data) byte = static_cast<std::uint8_t>(random());
    return data;
  }();
  return bytes;
}

const std::string& asciiText() {
  static const std::string text = [] {
    std::mt19937 random(42);
    std::string data(kSize, ' ');
    for (auto& c : data) c = static_cast<char>(' ' + random() % 95);
    return data;
  }();
  return text;
}

const std::string& encodedText() {
  static const std::string text = kivi::base64::encode(randomBytes());
  return text;
}

void BM_Sha256Kivi(benchmark::State& state) {
  const std::string& text = asciiText();
  for (auto _ : state) benchmark::DoNotOptimize(kivi::KivUtils::sha256Hash(text));
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * text.size()));
}

void BM_Sha256OpenSSL(benchmark::State& state) {
  const std::string& text = asciiText();
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned int length = 0;
  for (auto _ : state) {
    EVP_Digest(text.data(), text.size(), digest, &length, EVP_sha256(), nullptr);
    benchmark::DoNotOptimize(digest);
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * text.size()));
}

void BM_Base64EncodeKivi(benchmark::State& state) {
  const kivi::Data& bytes = randomBytes();
  for (auto _ : state) benchmark::DoNotOptimize(kivi::base64::encode(bytes));
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * bytes.size()));
}

void BM_Base64EncodeOpenSSL(benchmark::State& state) {
  const kivi::Data& bytes = randomBytes();
  for (auto _ : state) {
    std::string text(kivi::base64::encodedLength(bytes.size()) + 1, '\0');  // + its NUL
    EVP_EncodeBlock(reinterpret_cast<unsigned char*>(text.data()), bytes.data(),
                    static_cast<int>(bytes.size()));
    benchmark::DoNotOptimize(text);
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * bytes.size()));
}

void BM_Base64DecodeKivi(benchmark::State& state) {
  const std::string& text = encodedText();
  for (auto _ : state) benchmark::DoNotOptimize(kivi::base64::decode(text));
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * text.size()));
}

void BM_Base64DecodeOpenSSL(benchmark::State& state) {
  const std::string& text = encodedText();
  for (auto _ : state) {
    kivi::Data bytes(text.size() / 4 * 3);
    EVP_DecodeBlock(bytes.data(), reinterpret_cast<const unsigned char*>(text.data()),
                    static_cast<int>(text.size()));
    benchmark::DoNotOptimize(bytes);
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * text.size()));
}

}  // namespace

BENCHMARK(BM_Sha256Kivi)->Name("BM_Sha256/kivi")->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_Sha256OpenSSL)->Name("BM_Sha256/openssl")->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_Base64EncodeKivi)->Name("BM_Base64Encode/kivi")->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_Base64EncodeOpenSSL)->Name("BM_Base64Encode/openssl")->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_Base64DecodeKivi)->Name("BM_Base64Decode/kivi")->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_Base64DecodeOpenSSL)->Name("BM_Base64Decode/openssl")->Unit(benchmark::kMicrosecond);

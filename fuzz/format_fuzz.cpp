// Feeds arbitrary format strings and argument lists to the format engine and
// the logger. The input is read as: an argument count (0 to 8), each
// argument's kind and payload, then the rest as the format string. Beyond not
// crashing:
//   - formatting is deterministic and appends to what the output held;
//   - the format string with every "%" doubled prints back as itself;
//   - KivSdkLogger delivers exactly what kivi::format makes of a line;
//   - a C string becomes itself through nsStringFromCString when it is valid
//     UTF-8, and "<unknown>" when it is not.
#include <fuzzer/FuzzedDataProvider.h>

#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "fuzz_check.h"
#include "kivi/text/format.h"
#include "kivi/text/unicode_text.h"
#include "kivi/logging/kiv_sdk_logger.h"

using kivi::fuzz::check;

namespace {

class Described : public kivi::Object {
 public:
  explicit Described(std::string text) : text_(std::move(text)) {}
  std::string description() const override { return text_; }

 private:
  std::string text_;
};

class LastLine : public kivi::KivSdkLoggerDelegate {
 public:
  void logCriticalWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                             std::string_view m) override {
    message = m;
  }
  void logErrorWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                          std::string_view m) override {
    message = m;
  }
  void logWarnWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                         std::string_view m) override {
    message = m;
  }
  void logInfoWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                         std::string_view m) override {
    message = m;
  }
  void logVerboseWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                            std::string_view m) override {
    message = m;
  }
  void logSupportWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                            std::string_view m) override {
    message = m;
  }
  std::string message;
};

std::string formatAll(std::string_view format, const std::vector<kivi::FormatArg>& args) {
  std::string out;
  kivi::appendFormat(out, format, args);
  return out;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  FuzzedDataProvider input(data, size);
  // Storage the arguments point into; a deque keeps addresses stable.
  std::deque<std::string> texts;
  std::deque<kivi::Value> values;
  std::vector<std::shared_ptr<Described>> objects;
  std::vector<kivi::FormatArg> args;

  const int count = input.ConsumeIntegralInRange(0, 8);
  for (int i = 0; i < count; ++i) {
    switch (input.ConsumeIntegralInRange(0, 9)) {
      case 0:
        args.push_back(kivi::FormatArg::signedInt(input.ConsumeIntegral<std::int64_t>()));
        break;
      case 1:
        args.push_back(kivi::FormatArg::unsignedInt(input.ConsumeIntegral<std::uint64_t>()));
        break;
      case 2:
        args.push_back(kivi::FormatArg::floating(input.ConsumeFloatingPoint<double>()));
        break;
      case 3:
        texts.push_back(input.ConsumeRandomLengthString(64));
        args.push_back(kivi::FormatArg::cString(texts.back().c_str()));
        break;
      case 4:
        texts.push_back(input.ConsumeRandomLengthString(64));
        args.push_back(kivi::FormatArg::string(texts.back()));
        break;
      case 5:
        values.emplace_back(input.ConsumeRandomLengthString(64));
        args.push_back(kivi::FormatArg::value(values.back()));
        break;
      case 6:
        values.emplace_back(kivi::Array{kivi::Value(input.ConsumeFloatingPoint<double>()),
                                        kivi::Value(), kivi::Value(input.ConsumeBool())});
        args.push_back(kivi::FormatArg::value(values.back()));
        break;
      case 7:
        objects.push_back(std::make_shared<Described>(input.ConsumeRandomLengthString(64)));
        args.push_back(kivi::FormatArg::object(objects.back().get()));
        break;
      case 8:
        args.push_back(kivi::FormatArg::object(nullptr));
        break;
      default:
        args.push_back(kivi::FormatArg::pointer(
            reinterpret_cast<const void*>(input.ConsumeIntegral<std::uintptr_t>())));
    }
  }
  const std::string format = input.ConsumeRemainingBytesAsString();

  const std::string once = formatAll(format, args);
  std::string again = "kept";
  kivi::appendFormat(again, format, args);
  check(again == "kept" + once, "formatting is deterministic and appends", format);

  std::string escaped;
  for (char c : format) escaped.append(c == '%' ? 2 : 1, c);
  check(formatAll(escaped, args) == format, "doubled % prints the text back", format);

  auto delegate = std::make_shared<LastLine>();
  const auto logger = kivi::KivSdkLogger::create(delegate);
  const kivi::FormatArg first = args.empty() ? kivi::FormatArg::signedInt(0) : args[0];
  logger->logWithModule("fuzz", 4, format.c_str(), nullptr, 1, format, first);
  check(delegate->message == kivi::format(format, first), "the logger delivers the formatted line",
        format);

  const std::string_view cString(format.c_str());
  const std::string converted = kivi::KivSdkLogger::nsStringFromCString(format.c_str());
  check(converted == (kivi::unicode::isValidUTF8(cString) ? cString : "<unknown>"),
        "C strings convert when valid UTF-8", format);
  return 0;
}

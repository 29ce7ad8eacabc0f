#include "sim/world/log_capture.h"

#include <atomic>
#include <span>
#include <utility>

namespace spacekeep::sim {
namespace {

std::atomic<Trace*> g_trace = nullptr;

LogField fieldOf(const LogArgument& argument) {
  struct Visitor {
    LogField operator()(std::int64_t number) const { return number; }
    LogField operator()(std::uint64_t number) const { return number; }
    LogField operator()(double number) const { return number; }
    LogField operator()(std::string_view text) const { return std::string(text); }
    LogField operator()(const Value* value) const {
      return value == nullptr ? LogField() : LogField(*value);
    }
    LogField operator()(const Dictionary* dictionary) const {
      return dictionary == nullptr ? LogField() : LogField(Value(*dictionary));
    }
  };
  return std::visit(Visitor{}, argument);
}

void captureLine(const LogHandle*, std::int32_t level, const char*, const char* format,
                 std::span<const LogArgument> arguments) {
  Trace* trace = g_trace.load(std::memory_order_acquire);
  if (trace == nullptr) return;
  LogLine line{level, format, {}};
  line.fields.reserve(arguments.size());
  for (const LogArgument& argument : arguments) line.fields.push_back(fieldOf(argument));
  trace->add(std::move(line));
}

}  // namespace

LogCapture::LogCapture(Trace& trace) : trace_(trace), previous_handle_(getLogHandle()) {
  // One that is still there was given up together with its schedule, and never comes back.
  g_trace.store(&trace);
  handle_.level = kLogTrace;
  previous_write_ = gMOLogWrite.exchange(&captureLine);
  setLogHandle(&handle_);
}

LogCapture::~LogCapture() {
  setLogHandle(previous_handle_);
  gMOLogWrite.store(previous_write_);
  Trace* mine = &trace_;
  g_trace.compare_exchange_strong(mine, nullptr);
}

}  // namespace spacekeep::sim

#include "fault/interception.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <utility>

#include "fault/fault.h"

namespace Fault {
namespace {

std::array<Interception*, 16> waiting{};

}  // namespace

std::string_view PlainName(std::string_view name) {
  const auto isEnd = [&](std::string_view end) {
    return name.size() > end.size() && name.substr(name.size() - end.size()) == end;
  };
  if (name.substr(0, 2) == "__") name.remove_prefix(2);
  for (const std::string_view end : {"_time64", "64"}) {
    if (isEnd(end)) name.remove_suffix(end.size());
  }
  return name;
}

Interception::Interception(std::string callName, int callNumber, std::function<int()> toRun)
    : call(std::move(callName)), number(callNumber), action(std::move(toRun)) {
  auto* const place = std::find(waiting.begin(), waiting.end(), nullptr);
  if (place == waiting.end()) abort();
  *place = this;
}

Interception::Interception(std::string callName, int callNumber, int error)
    : Interception(std::move(callName), callNumber, [error] { return error; }) {}

Interception::~Interception() { *std::find(waiting.begin(), waiting.end(), this) = nullptr; }

bool Intercepts(std::string_view call) {
  if (IsSuspended() || LogCapture::IsRecording()) return false;
  int error = kGoOn;
  for (Interception* const one : waiting) {
    if (one == nullptr || one->call != PlainName(call) || --one->number != 0) continue;
    const Suspension suspension;
    error = one->action();
  }
  if (error != kGoOn) errno = error;
  return error != kGoOn;
}

}  // namespace Fault

#include "ko/future.hpp"

namespace ko {

const char* futureStateName(FutureState state) noexcept {
  switch (state) {
    case FutureState::None:
      return "None";
    case FutureState::Running:
      return "Running";
    case FutureState::FinishedWithValue:
      return "FinishedWithValue";
    case FutureState::FinishedWithError:
      return "FinishedWithError";
    case FutureState::Canceled:
      return "Canceled";
    case FutureState::Timeout:
      return "Timeout";
  }
  return "Unknown";
}

namespace detail {

std::string currentExceptionText() {
  try {
    throw;
  } catch (const std::exception& e) {
    return e.what();
  } catch (...) {
    return "Unknown exception";
  }
}

}  // namespace detail
}  // namespace ko

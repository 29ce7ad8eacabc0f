#include "ctl/report/history_call.h"

namespace spacekeep::ctl {

AskHistory historyOver(sdk::Client& /*client*/) {
  return [](const Dictionary& /*request*/) {
    return sdk::Reply{.outcome = {},
                      .error = sdk::Error{sdk::ErrorKind::kNotSupported, "no history is kept"}};
  };
}

}  // namespace spacekeep::ctl

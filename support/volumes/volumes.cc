#include "support/volumes/volumes.h"

namespace spacekeep {

std::uint64_t Volumes::amountPurged(const Dictionary& request) {
  // Without a beginning nothing can be said to have been freed since then.
  const auto begin = unsignedAt(request, "SPACEKEEP_FREESPACE_BEGIN");
  if (!begin) return 0;
  const std::uint64_t now = volumeFreespace(request.find("SPACEKEEP_VOLUME"));
  return now > *begin ? now - *begin : 0;
}

}  // namespace spacekeep

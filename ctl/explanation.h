// Thread safety: pure functions over plain values.
//
// In words: why a volume is short of space or not, what could be done, and by whom.
#pragma once

#include <map>
#include <string>
#include <vector>

#include "ctl/declared_services.h"
#include "ctl/offers.h"
#include "ctl/style.h"
#include "support/volumes/low_space_settings.h"
#include "support/volumes/space_source.h"

namespace spacekeep::ctl {

struct Paragraph {
  std::string text;
  bool is_item = false;  ///< one of a list that the paragraph before it announces
};

/// What there is to know about one volume.
struct VolumeFacts {
  VolumeSample sample;
  LowSpaceSettings settings;  ///< by which it is judged
  bool finish_early = false;  ///< purges end as soon as their amount is there
  VolumeOffers offers;
  std::map<std::string, DeclaredService> declared;
  /// Of those declared: the sockets that are not there, by service.
  std::map<std::string, std::string> missing_sockets;
  std::vector<Paragraph> past = {};  ///< what was done here, in words
};

/// The first says in a word how the volume is.
[[nodiscard]] std::vector<Paragraph> explanationOf(const VolumeFacts& facts);

/// On a terminal broken where its width demands it.
[[nodiscard]] std::string textOf(const std::vector<Paragraph>& explanation, const Style& style);

/// How it is with the services that could give nothing, and with those that are not counted.
[[nodiscard]] std::vector<Paragraph> silenceOf(const VolumeFacts& facts);

}  // namespace spacekeep::ctl

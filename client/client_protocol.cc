#include "client/client_protocol.h"

namespace spacekeep {

const ipc::InterfaceDescription& spacekeepClientInterface() {
  using Kind = ipc::ArgumentKind;
  static const ipc::InterfaceDescription interface {
    "com.quorvel.SpacekeepClientProtocol", {
      {"clientCheckin",
       {{"serviceID", Kind::kString}, {"endpoint", Kind::kDescriptor}, {"info", Kind::kDictionary}},
       {{"result", Kind::kOptionalDictionary}, {"error", Kind::kOptionalString}}},
          {"clientPurgeableSpace",
           {{"info", Kind::kDictionary}},
           {{"result", Kind::kOptionalDictionary}}},
          {"clientItemizedPurgeableSpace",
           {{"info", Kind::kDictionary}},
           {{"result", Kind::kOptionalDictionary}}},
          {"clientPurge", {{"info", Kind::kDictionary}}, {{"result", Kind::kOptionalDictionary}}},
          {"clientCancelPurge", {{"info", Kind::kDictionary}}, {}},
          {"clientSetState", {{"value", Kind::kOptionalValue}, {"key", Kind::kString}}, {}},
          {"clientGetState", {{"key", Kind::kString}}, {{"value", Kind::kOptionalValue}}},
    }
  };
  return interface;
}

}  // namespace spacekeep

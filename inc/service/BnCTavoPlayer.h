// BnCTavoPlayer: the service side of ICTavoPlayer. onTransact checks the interface
// token of every request it answers, reads the arguments in the order the client
// writes them, calls the operation and writes the reply; codes without an
// operation go to the platform binder's default handling (ping, interface query,
// dump). Runs on binder threads; the implementation serialises its commands.
#pragma once

#include "platform/binder/BnInterface.h"
#include "service/ICTavoPlayer.h"

namespace TavoPlayer {

class BnCTavoPlayer : public android::BnInterface<ICTavoPlayer> {
public:
    // A wrong token gives -1 as the transaction status (nothing is called). A request
    // too short for its arguments gives BAD_VALUE, also without a call.
    android::status_t onTransact(uint32_t code, const android::Parcel& data, android::Parcel* reply,
                                 uint32_t flags = 0) override;
};

}  // namespace TavoPlayer

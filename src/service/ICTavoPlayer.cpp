#include "service/ICTavoPlayer.h"

#include "service/BpCTavoPlayer.h"

namespace TavoPlayer {

IMPLEMENT_META_INTERFACE(CTavoPlayer, "TavoPlayer")

}  // namespace TavoPlayer

#include "service/ICTavoPlayerClient.h"

#include "service/BpCTavoPlayerClient.h"

namespace TavoPlayer {

IMPLEMENT_META_INTERFACE(CTavoPlayerClient, "TavoPlayerClient")

}  // namespace TavoPlayer

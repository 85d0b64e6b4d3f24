#include "platform/binder/IBinder.h"

#include "platform/binder/IInterface.h"

namespace android {

sp<IInterface> IBinder::queryLocalInterface(const String16& /*descriptor*/) {
    return nullptr;
}

}  // namespace android

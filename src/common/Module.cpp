#include "common/Module.h"

namespace TavoPlayer {

Module::Module(const std::string& name) : mName(name), mWord(0) {}

Module::Module(const Module& other) : android::RefBase(), mName(other.mName), mWord(other.mWord) {}

Module::~Module() = default;

unsigned int Module::onError(unsigned int code) {
    for (const ErrorListener* listener : mErrorListeners) {
        listener->onError(code, this);
    }
    return 0;
}

std::string Module::getModuleName() const {
    return mName;
}

unsigned int Module::addOutput(const android::sp<RingBuffer>& ring, OutputList::iterator* where) {
    auto added = mOutputs.insert(mOutputs.end(), ring);
    if (where != nullptr)
        *where = added;
    return 0;
}

void Module::removeOutput(OutputList::iterator* where) {
    if (where == nullptr)
        return;
    *where = mOutputs.erase(*where);
}

unsigned int Module::setInput(const android::sp<RingBuffer>& ring) {
    mInput = ring;
    return 0;
}

unsigned int Module::dump(FILE* stream, int indent) {
    if (stream == nullptr)
        return 0;
    const std::string prefix(indent > 0 ? static_cast<size_t>(indent) : 0, '\t');
    fprintf(stream, "%s - Module Name: %s\n", prefix.c_str(), mName.c_str());
    return 0;
}

void Module::addErrorListener(const ErrorListener& listener) {
    mErrorListeners.push_back(&listener);
}

}  // namespace TavoPlayer

// Module: the base of every pipeline stage. A module has a fixed name, at most
// one input ring, any number of output rings (in the order added) and a list of
// error listeners to which it reports failures by code (see ModuleErrors.h).
//
// Wiring (setInput, addOutput, removeOutput, addErrorListener) is done by the
// controller while the module is stopped; the lists are not locked.
#pragma once

#include <cstdint>
#include <cstdio>
#include <list>
#include <string>

#include <utils/RefBase.h>
#include <utils/StrongPointer.h>

#include "common/ErrorListener.h"
#include "common/ModuleErrors.h"
#include "common/RingBuffer.h"

namespace TavoPlayer {

class Module : public virtual android::RefBase {
public:
    using OutputList = std::list<android::sp<RingBuffer>>;

    explicit Module(const std::string& name);
    // Copies only the name and mWord: the copy has no rings and no listeners.
    Module(const Module& other);
    Module& operator=(const Module&) = delete;

    // Reports `code` to every error listener, first added first. Returns 0.
    virtual unsigned int onError(unsigned int code);
    virtual std::string getModuleName() const;
    virtual unsigned int start() = 0;
    virtual unsigned int stop() = 0;
    // Appends `ring`; when `where` is not null it receives an iterator to the new
    // element, for a later removeOutput of exactly this output. Returns 0.
    virtual unsigned int addOutput(const android::sp<RingBuffer>& ring,
                                   OutputList::iterator* where);
    // Erases *where and moves *where to the following element.
    virtual void removeOutput(OutputList::iterator* where);
    virtual unsigned int setInput(const android::sp<RingBuffer>& ring);
    virtual unsigned int dump(FILE* stream, int indent);
    ~Module() override;

    // The listener is not owned and must outlive the module; there is no removal.
    void addErrorListener(const ErrorListener& listener);

protected:
    OutputList mOutputs;
    android::sp<RingBuffer> mInput;
    std::list<const ErrorListener*> mErrorListeners;
    const std::string mName;
    // Left to derived modules; the base neither sets nor reads it.
    uint32_t mWord;
};

}  // namespace TavoPlayer

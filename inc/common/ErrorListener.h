// ErrorListener: receives the failures that modules report by code. The player
// service implements it; calls arrive on whatever thread found the failure.
#pragma once

namespace TavoPlayer {

class Module;

class ErrorListener {
public:
    virtual ~ErrorListener() = default;
    virtual void onError(unsigned int code, const Module* module) const = 0;
};

}  // namespace TavoPlayer

#include "common/Module.h"

#include <gtest/gtest.h>

#include <vector>

namespace TavoPlayer {
namespace {

class TestModule : public Module {
public:
    explicit TestModule(const std::string& name) : Module(name) {}
    unsigned int start() override { return 0; }
    unsigned int stop() override { return 0; }
};

struct Call {
    int listener;
    unsigned int code;
    const Module* module;
};

class RecordingListener : public ErrorListener {
public:
    RecordingListener(int id, std::vector<Call>* calls) : mId(id), mCalls(calls) {}
    void onError(unsigned int code, const Module* module) const override {
        mCalls->push_back({mId, code, module});
    }

private:
    int mId;
    std::vector<Call>* mCalls;
};

class ModuleTest : public ::testing::Test {
protected:
    android::sp<TestModule> module = new TestModule("TS Parser");
    std::vector<Call> calls;
};

TEST_F(ModuleTest, OnErrorReachesListenersInOrderWithTheModule) {
    EXPECT_EQ(0u, module->onError(0x21003));  // none yet
    EXPECT_TRUE(calls.empty());
    RecordingListener first(1, &calls);
    RecordingListener second(2, &calls);
    module->addErrorListener(first);
    module->addErrorListener(second);
    EXPECT_EQ(0u, module->onError(0x21003));
    ASSERT_EQ(2u, calls.size());
    EXPECT_EQ(1, calls[0].listener);
    EXPECT_EQ(2, calls[1].listener);
    for (const Call& call : calls) {
        EXPECT_EQ(0x21003u, call.code);
        EXPECT_EQ(module.get(), call.module);
    }
}

}  // namespace
}  // namespace TavoPlayer

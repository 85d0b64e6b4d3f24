#include "common/Module.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace TavoPlayer {
namespace {

class TestModule : public Module {
public:
    explicit TestModule(const std::string& name) : Module(name) {}
    unsigned int start() override { return 0; }
    unsigned int stop() override { return 0; }
};

struct MockErrorListener : ErrorListener {
    MOCK_METHOD(void, onError, (unsigned int code, const Module* module), (const, override));
};

TEST(ModuleTest, OnErrorReachesListenersInOrderWithTheModule) {
    android::sp<TestModule> module = new TestModule("TS Parser");
    EXPECT_EQ(0u, module->onError(0x21003));  // none yet
    MockErrorListener first, second;
    module->addErrorListener(first);
    module->addErrorListener(second);
    ::testing::InSequence firstAddedFirst;
    EXPECT_CALL(first, onError(0x21003u, module.get()));
    EXPECT_CALL(second, onError(0x21003u, module.get()));
    EXPECT_EQ(0u, module->onError(0x21003));
}

}  // namespace
}  // namespace TavoPlayer

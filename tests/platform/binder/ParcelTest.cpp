#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "platform/binder/BBinder.h"
#include "platform/binder/Parcel.h"

#include "support/NamedRow.h"

namespace android {
namespace {

using TavoPlayer::test::PrintTo;

// The exact bytes each writer produces: the layout a client in another language
// builds by hand, so a change here breaks compatibility. Reading them back is what
// every call of the service protocol test does.
TEST(ParcelEncodingTest, BytesOnTheWire) {
    Parcel p;
    p.writeInt32(-2);
    p.writeInt64(0x0102030405060708LL);
    p.writeString16(String16("Ab"));
    p.writeString16(String16(""));
    p.writeNullString16();
    p.writeString8(String8("xyz"));
    p.writeInterfaceToken(String16("T"));
    const std::vector<uint8_t> expected = {
        0xfe, 0xff, 0xff, 0xff,                          // int32 -2
        0x08, 0x07, 0x06, 0x05, 0x04, 0x03, 0x02, 0x01,  // int64, little-endian
        2,    0,    0,    0,    'A',  0,    'b',  0,
        0,    0,    0,    0,                          // "Ab": length, units, 0 unit, pad
        0,    0,    0,    0,    0,    0,    0,    0,  // "": length 0, 0 unit, pad
        0xff, 0xff, 0xff, 0xff,                       // null string
        3,    0,    0,    0,    'x',  'y',  'z',  0,  // 8-bit "xyz" and its 0
        0,    0,    0x40, 0,                          // strict-mode word of a token
        1,    0,    0,    0,    'T',  0,    0,    0,  // descriptor "T"
    };
    EXPECT_EQ(expected, std::vector<uint8_t>(p.data(), p.data() + p.dataSize()));
}

// Every read on short or damaged data: an error status, the position unchanged, and
// never a read outside the parcel (the sanitizer builds check that).
struct ShortReadCase {
    const char* name;
    std::vector<uint8_t> data;
    std::function<status_t(const Parcel&)> read;
    status_t expected;
};

class ParcelShortReadTest : public ::testing::TestWithParam<ShortReadCase> {};

TEST_P(ParcelShortReadTest, FailsWithoutMoving) {
    const ShortReadCase& c = GetParam();
    Parcel p;
    ASSERT_EQ(OK, p.setData(c.data.data(), c.data.size()));
    EXPECT_EQ(c.expected, c.read(p));
    EXPECT_EQ(0u, p.dataPosition());
}

const auto readI32 = [](const Parcel& p) {
    int32_t v = 7;
    const status_t err = p.readInt32(&v);
    return err == OK || v == 7 ? err : UNKNOWN_ERROR;  // a failed read leaves v alone
};
const auto readS16 = [](const Parcel& p) {
    String16 s;
    return p.readString16(&s);
};
const auto readS8 = [](const Parcel& p) {
    String8 s;
    return p.readString8(&s);
};
const auto readBinder = [](const Parcel& p) {
    sp<IBinder> b;
    return p.readStrongBinder(&b);
};
const auto readFd = [](const Parcel& p) { return static_cast<status_t>(p.readFileDescriptor()); };
const auto readBytes = [](const Parcel& p) {
    uint8_t out[5];
    return p.read(out, sizeof out);
};
const auto token = [](const Parcel& p) {
    return p.enforceInterface(String16("TavoPlayer")) ? OK : BAD_VALUE;
};

const ShortReadCase kShortReads[] = {
    {"int32_of_3_bytes", {1, 2, 3}, readI32, NOT_ENOUGH_DATA},
    {"string16_units_missing", {5, 0, 0, 0, 'a', 0}, readS16, NOT_ENOUGH_DATA},
    {"string16_length_huge", {0xff, 0xff, 0xff, 0x7f, 'a', 0, 0, 0}, readS16, NOT_ENOUGH_DATA},
    {"string16_negative_length", {0xfe, 0xff, 0xff, 0xff}, readS16, BAD_VALUE},
    {"string16_without_terminator", {1, 0, 0, 0, 'a', 0, 'b', 0}, readS16, NOT_ENOUGH_DATA},
    {"string8_bytes_missing", {9, 0, 0, 0, 'a', 'b', 'c', 'd'}, readS8, NOT_ENOUGH_DATA},
    {"binder_from_plain_data", std::vector<uint8_t>(24, 0), readBinder, BAD_TYPE},
    {"binder_past_end", {0x85, 0x2a, 0x62, 0x73}, readBinder, NOT_ENOUGH_DATA},
    {"fd_from_plain_data", std::vector<uint8_t>(24, 0), readFd, BAD_TYPE},
    {"raw_bytes_past_end", {1, 2, 3, 4}, readBytes, NOT_ENOUGH_DATA},
    {"token_without_descriptor", {0, 0, 0x40, 0}, token, BAD_VALUE},
};
INSTANTIATE_TEST_SUITE_P(Reads, ParcelShortReadTest, ::testing::ValuesIn(kShortReads),
                         [](const auto& info) { return info.param.name; });

// Objects are recognised only where they were written.
TEST(ParcelObjectTest, BindersAndDescriptorsReadBackAtTheirOffsets) {
    sp<IBinder> local = new BBinder();
    Parcel p;
    p.writeInt32(1);
    p.writeStrongBinder(local);
    p.writeStrongBinder(nullptr);
    p.writeDupFileDescriptor(0);
    EXPECT_EQ(3u, p.objectCount());
    EXPECT_EQ(4u + 3 * Parcel::kFlatObjectBytes, p.dataSize());

    p.setDataPosition(0);
    EXPECT_EQ(BAD_TYPE, p.readFileDescriptor());  // the int32 is not an object
    EXPECT_EQ(1, p.readInt32());
    EXPECT_EQ(BAD_TYPE, p.readFileDescriptor());  // a binder is not a descriptor
    EXPECT_EQ(local, p.readStrongBinder());
    sp<IBinder> none = local;
    EXPECT_EQ(OK, p.readStrongBinder(&none));
    EXPECT_EQ(nullptr, none);
    EXPECT_GE(p.readFileDescriptor(), 0);
}

}  // namespace
}  // namespace android

#include "decoder/ClosedCaptionDecoder.h"

#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <new>
#include <string>

#include "common/data/ClosedCaptionFragmentData.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {
namespace {

// ARIB STD-B24 Volume 1 Part 3, 9.1 and 9.4: synchronised PES data, and the data
// unit that carries caption text.
constexpr uint8_t kDataIdentifier = 0x80;
constexpr uint8_t kUnitSeparator = 0x1F;
constexpr uint8_t kStatementBody = 0x20;
constexpr size_t kDataGroupHeaderSize = 5;  // id and version, link numbers, 16-bit size
constexpr size_t kPresentationTimeSize = 5;

// The unit's byte counter is 8 bits wide (see processPacket).
constexpr uint32_t kMaxUnitSize = 256;
// A CSI sequence is a few parameters long; collecting stops at the next control
// byte, which on a damaged stream may be far away, so the buffer is capped and the
// last slot keeps the latest byte (the one taken as the final byte).
constexpr size_t kMaxCSIBytes = 64;

// C0 and C1 control sets (ARIB STD-B24 Volume 1 Part 2, Table 7-14 and 7-15).
enum : uint8_t {
    BEL = 0x07,
    APB = 0x08,
    APF = 0x09,
    APD = 0x0A,
    APU = 0x0B,
    CS = 0x0C,
    APR = 0x0D,
    LS1 = 0x0E,
    LS0 = 0x0F,
    PAPF = 0x16,
    CAN = 0x18,
    SS2 = 0x19,
    ESC = 0x1B,
    APS = 0x1C,
    SS3 = 0x1D,
    BKF = 0x80,
    RDF = 0x81,
    GRF = 0x82,
    YLF = 0x83,
    BLF = 0x84,
    MGF = 0x85,
    CNF = 0x86,
    WHF = 0x87,
    SSZ = 0x88,
    MSZ = 0x89,
    NSZ = 0x8A,
    SZX = 0x8B,
    COL = 0x90,
    FLC = 0x91,
    CDC = 0x92,
    POL = 0x93,
    WMM = 0x94,
    MACRO = 0x95,
    HLC = 0x97,
    RPC = 0x98,
    SPL = 0x99,
    STL = 0x9A,
    CSI = 0x9B,
    TIME = 0x9D,
};

// ABNT NBR 15606-1 writes Latin text in ISO 8859-1 positions but takes eight of
// them from ISO 8859-15.
uint32_t latinCodePoint(uint8_t byte) {
    switch (byte) {
        case 0xA4:
            return 0x20AC;
        case 0xA6:
            return 0x0160;
        case 0xA8:
            return 0x0161;
        case 0xB4:
            return 0x017D;
        case 0xB8:
            return 0x017E;
        case 0xBC:
            return 0x0152;
        case 0xBD:
            return 0x0153;
        case 0xBE:
            return 0x0178;
        default:
            return byte;
    }
}

// The special set reached through SS3: the music note, the ISO 8859-1 characters
// displaced by the replacements above, and typographic signs.
uint32_t specialCodePoint(uint8_t byte) {
    static const uint32_t kDisplaced[8] = {0x00A4, 0x00A6, 0x00A8, 0x00B4,
                                           0x00B8, 0x00BC, 0x00BD, 0x00BE};
    static const uint32_t kSigns[12] = {0x2026, 0x2588, 0x2018, 0x2019, 0x201C, 0x201D,
                                        0x2022, 0x2122, 0x215B, 0x215C, 0x215D, 0x215E};
    if (byte == 0x21)
        return 0x266A;
    if (byte >= 0x30 && byte <= 0x37)
        return kDisplaced[byte - 0x30];
    if (byte >= 0x40 && byte <= 0x4B)
        return kSigns[byte - 0x40];
    return byte;
}

}  // namespace

ClosedCaptionDecoder::ClosedCaptionDecoder() : Module("ClosedCaptionDecoder") {
    resetState();
}

ClosedCaptionDecoder::~ClosedCaptionDecoder() {
    if (mWorkerThread != nullptr)
        stop();
}

void ClosedCaptionDecoder::resetState() {
    mParameterCount = 0;
    mCSI = false;
    mCSILength = 0;
    mPAPF = mAPS = mSZX = mCOL = mFLC = mCDC = mPOL = mWMM = mMACRO = mHLC = mRPC = mTIME = false;
    mNewLine = false;
    memset(mCSIParam, 0, sizeof(mCSIParam));
    mCSIBuffer.clear();
    mCCString.clear();
    memset(mScreen, 0, sizeof(mScreen));
    mBEL = mCAN = mESC = mLS0 = mLS1 = mSS2 = 0;
    mSS3 = false;
    mBKF = mRDF = mGRF = mYLF = mBLF = mMGF = mCNF = mWHF = mSSZ = mMSZ = mNSZ = mSTL = mSPL = 0;
    mCOLParam = mPOLParam = mFLCParam = mWMMParam = mMACROParam = mRPCParam = mHLCParam =
        mSZXParam = 0;
    mCDCParam[0] = mCDCParam[1] = 0;
    mTIMEParam[0] = mTIMEParam[1] = 0;
    mAPSRow = mAPSColumn = 0;
    mAPSRowSeen = mCDCFirstSeen = mTIMEFirstSeen = false;
    memset(&mCSIAttributes, 0, sizeof(mCSIAttributes));
    mRow = -1;
    mColumn = -1;
}

unsigned int ClosedCaptionDecoder::start() {
    if (mInput == nullptr || mOutputs.empty()) {
        TAVO_LOGE("%s NULL parameter!\n", __func__);
        return REFUSED;
    }
    if (mWorkerThread != nullptr)
        return OK;
    mWorkerThread = new WorkerThread(this);
    if (mWorkerThread->run("CCWorkerThread") != android::OK) {
        TAVO_LOGE("%s: could not start CCWorkerThread\n", __func__);
        mWorkerThread.clear();
        return REFUSED;
    }
    return OK;
}

unsigned int ClosedCaptionDecoder::stop() {
    if (mWorkerThread != nullptr) {
        mWorkerThread->requestExit();
        // The worker waits at most 100 ms on either ring; these wake-ups cut it short.
        if (mInput != nullptr)
            mInput->wakeAll();
        for (const auto& output : mOutputs)
            output->wakeAll();
        mWorkerThread->join();
        // The thread drops its own reference just after join returns; waiting for
        // that lets this thread release the last one, after the thread is done.
        for (int i = 0; i < 1000 && mWorkerThread->getStrongCount() > 1; ++i)
            usleep(1000);
        mWorkerThread.clear();
    }
    return OK;
}

unsigned int ClosedCaptionDecoder::dump(FILE* stream, int indent) {
    if (stream == nullptr)
        return OK;
    Module::dump(stream, indent);
    const std::string prefix(indent >= 0 ? static_cast<size_t>(indent) + 1 : 1, '\t');
    fprintf(stream, "%s - Caption size: %u\n", prefix.c_str(), getCCSize());
    fprintf(stream, "%s - Row: %d Column: %d\n", prefix.c_str(), mRow, mColumn);
    return OK;
}

void ClosedCaptionDecoder::WorkerThreadRunner() {
    if (!mInput->waitForData(PESData::kHeaderSize))
        return;
    auto* record = reinterpret_cast<PESData*>(mInput->readPointer());
    const uint32_t size = record->mSize;
    if (size == 0) {
        mInput->abortRead();
        return;
    }
    processPacket(record);
    mInput->consume(size);
    // Every PES starts on an empty screen.
    clearScreenData();
}

unsigned int ClosedCaptionDecoder::processPacket(PESData* record) {
    if (record == nullptr)
        return RESULT_NOTHING;
    const uint8_t* bytes = reinterpret_cast<const uint8_t*>(record);
    const size_t end = record->mSize;
    size_t at = record->mOffsetES;
    // Every read is bounded by the record's end.
    const auto has = [&](size_t count) { return at <= end && end - at >= count; };

    // PES_data_packet (ARIB STD-B24 Volume 1 Part 3, 9.1 and 9.2).
    if (!has(3) || bytes[at] != kDataIdentifier)
        return RESULT_NOTHING;
    at += 3 + (bytes[at + 2] & 0x0F);
    // The data group is not told apart by its id: every group is read as caption
    // statement data, so there is no choice of caption language; a management group
    // normally fails at the unit separator below.
    if (!has(kDataGroupHeaderSize + 1))
        return RESULT_NOTHING;
    at += kDataGroupHeaderSize;
    // caption_data: TMD 01 (real time) or 10 (offset time) carries a 40-bit STM.
    const uint8_t timeControlMode = bytes[at] >> 6;
    at += (timeControlMode == 1 || timeControlMode == 2) ? 1 + kPresentationTimeSize : 1;
    // data_unit_loop_length, then one data unit (9.4).
    if (!has(3 + 2 + 3))
        return RESULT_NOTHING;
    at += 3;
    if (bytes[at] != kUnitSeparator)
        return RESULT_NOTHING;
    if (bytes[at + 1] != kStatementBody)
        return RESULT_NOT_BODY;
    const uint32_t unitSize = (static_cast<uint32_t>(bytes[at + 2]) << 16) |
                              (static_cast<uint32_t>(bytes[at + 3]) << 8) | bytes[at + 4];
    at += 5;
    if (!has(unitSize))
        return RESULT_NOTHING;
    if (unitSize >= kMaxUnitSize) {
        // The unit is walked with an 8-bit counter, which can never reach a size of
        // 256 or more; such a unit is dropped rather than walked forever.
        TAVO_LOGW("%s: caption data unit of %u bytes dropped (more than 255)\n", __func__,
                  unitSize);
        return RESULT_NOTHING;
    }
    for (uint8_t i = 0; i != static_cast<uint8_t>(unitSize); ++i)
        processCCByte(bytes[at + i]);

    if (mRow == -1 && mColumn == -1)
        return RESULT_EMPTY;
    const unsigned int length = buildCCString();
    if (length < 1)
        return RESULT_NOTHING;

    if (mOutputs.empty() || mOutputs.front() == nullptr)
        return RESULT_NOTHING;
    const android::sp<RingBuffer>& output = mOutputs.front();
    const uint32_t recordSize = ClosedCaptionFragmentData::kHeaderSize + length;
    if (!output->waitForSpace(recordSize))
        return RESULT_NOTHING;
    auto* caption = new (output->writePointer()) ClosedCaptionFragmentData();
    caption->mSize = recordSize;
    caption->mPTS = record->mPTS;
    memcpy(caption->textBytes(), mCCString.data(), length);
    output->commitWrite(recordSize);
    return RESULT_WRITTEN;
}

void ClosedCaptionDecoder::processCCByte(unsigned char byte) {
    if ((byte >= 0x07 && byte <= 0x1F) || (byte >= 0x80 && byte <= 0x9D)) {
        findCommand(byte);
        return;
    }
    if (mParameterCount != 0) {
        findCommand(byte);
        return;
    }
    if (mCSI) {
        // Intended: collecting lasts until the next control byte, so printable bytes
        // after a CSI sequence are swallowed into it.
        if (mCSIBuffer.size() < kMaxCSIBytes)
            mCSIBuffer.push_back(byte);
        else
            mCSIBuffer.back() = byte;
        ++mCSILength;
        return;
    }
    // Kept across packets, as designed.
    if (mCOLParam == 0x58)
        return;

    const int32_t oldColumn = mColumn;
    ++mColumn;
    if (oldColumn < kColumns - 1 && !mNewLine) {
        if (mRow == -1)
            mRow = 0;
    } else {
        mColumn = 0;
        if (mRow >= kRows - 1) {
            scrollUp();
            mRow = kRows - 1;
        } else {
            ++mRow;
        }
    }

    uint32_t codePoint;
    if (mSS3) {
        codePoint = specialCodePoint(byte);
        mSS3 = false;
    } else {
        codePoint = latinCodePoint(byte);
    }

    if (codePoint == 0 && mRow == 0) {
        mRow = -1;
        return;
    }
    if (mRow >= 0 && mRow < kRows && mColumn >= 0 && mColumn < kColumns)
        mScreen[mRow][mColumn] = codePoint;
    mNewLine = false;
}

void ClosedCaptionDecoder::scrollUp() {
    memcpy(mScreen[0], mScreen[1], sizeof(mScreen[0]));
    memcpy(mScreen[1], mScreen[2], sizeof(mScreen[1]));
    memset(mScreen[2], 0, sizeof(mScreen[2]));
}

void ClosedCaptionDecoder::findCommand(unsigned char byte) {
    if (mCSI) {
        identifyCSICommand();
        mCSI = false;
    }
    switch (byte) {
        case BEL:
            mBEL = 1;
            break;
        case APB:
        case APF:
        case APU:
            break;
        case APD:
            mNewLine = true;
            break;
        case CS:
            clearScreenData();
            break;
        case APR:
            mNewLine = true;
            break;
        case LS1:
            mLS1 = 1;
            break;
        case LS0:
            mLS0 = 1;
            break;
        case PAPF:
            mPAPF = true;
            mParameterCount = 1;
            break;
        case CAN:
            mCAN = 1;
            break;
        case SS2:
            mSS2 = 1;
            break;
        case ESC:
            mESC = 1;
            break;
        case APS:
            mAPS = true;
            mAPSRowSeen = false;
            mParameterCount = 2;
            break;
        case SS3:
            mSS3 = true;
            break;
        case 0x17:
        case 0x1A:
        case 0x1E:
        case 0x1F:
            break;
        case BKF:
            mBKF = 1;
            break;
        case RDF:
            mRDF = 1;
            break;
        case GRF:
            mGRF = 1;
            break;
        case YLF:
            mYLF = 1;
            break;
        case BLF:
            mBLF = 1;
            break;
        case MGF:
            mMGF = 1;
            break;
        case CNF:
            mCNF = 1;
            break;
        case WHF:
            mWHF = 1;
            break;
        case SSZ:
            mSSZ = 1;
            break;
        case MSZ:
            mMSZ = 1;
            break;
        case NSZ:
            mNSZ = 1;
            break;
        case SZX:
            mSZX = true;
            mParameterCount = 1;
            break;
        case COL:
            mCOL = true;
            mParameterCount = 1;
            break;
        case FLC:
            mFLC = true;
            mParameterCount = 1;
            break;
        case CDC:
            mCDC = true;
            mCDCFirstSeen = false;
            mParameterCount = 2;
            break;
        case POL:
            mPOL = true;
            mParameterCount = 1;
            break;
        case WMM:
            mWMM = true;
            mParameterCount = 1;
            break;
        case MACRO:
            mMACRO = true;
            mParameterCount = 1;
            break;
        case 0x96:
        case 0x9C:
            break;
        case HLC:
            mHLC = true;
            mParameterCount = 1;
            break;
        case RPC:
            mRPC = true;
            mParameterCount = 1;
            break;
        case SPL:
            mSPL = 1;
            break;
        case STL:
            mSTL = 1;
            break;
        case CSI:
            mCSI = true;
            mCSIBuffer.clear();
            mCSILength = 0;
            break;
        case TIME:
            mTIME = true;
            mTIMEFirstSeen = false;
            mParameterCount = 2;
            break;
        default:
            // 0x10..0x15, 0x8C..0x8F and every parameter byte. Intended: the count
            // goes on down even below zero.
            handleCommands(byte);
            --mParameterCount;
            break;
    }
}

void ClosedCaptionDecoder::handleCommands(uint8_t byte) {
    if (mAPS) {
        if (!mAPSRowSeen) {
            // APS P1 is the row, coded from 0x40 (ARIB STD-B24 Volume 1 Part 2, 7.2.4).
            mAPSRow = byte;
            mAPSRowSeen = true;
            if (byte >= 0x40 && byte <= 0x7F)
                mNewLine = true;
            else
                TAVO_LOGW("%d out of scope at %s\n", byte,
                          "void TavoPlayer::ClosedCaptionDecoder::handleCommands(uint8_t)");
        } else {
            mAPSColumn = byte;
            ++mColumn;
            mAPS = false;
        }
    } else if (mSZX) {
        mSZXParam = byte;
        mSZX = false;
    } else if (mCOL) {
        mCOLParam = byte;
        mCOL = false;
    } else if (mFLC) {
        mFLCParam = byte;
        mFLC = false;
    } else if (mCDC) {
        mCDCParam[mCDCFirstSeen ? 1 : 0] = byte;
        mCDC = !mCDCFirstSeen;
        mCDCFirstSeen = true;
    } else if (mPOL) {
        mPOLParam = byte;
        mPOL = false;
    } else if (mWMM) {
        mWMMParam = byte;
        mWMM = false;
    } else if (mMACRO) {
        mMACROParam = byte;
        mMACRO = false;
    } else if (mHLC) {
        mHLCParam = byte;
        mHLC = false;
    } else if (mRPC) {
        mRPCParam = byte;
        mRPC = false;
    } else if (mTIME) {
        mTIMEParam[mTIMEFirstSeen ? 1 : 0] = byte;
        mTIME = !mTIMEFirstSeen;
        mTIMEFirstSeen = true;
    }
}

void ClosedCaptionDecoder::identifyCSICommand() {
    const uint8_t final = mCSIBuffer.empty() ? 0 : mCSIBuffer.back();
    if (final < 0x42 || final > 0x6E) {
        TAVO_LOGD("CONTROLCODE not valid\n");
        mCSIBuffer.clear();
        mCSILength = 0;
        return;
    }
    // Parameters: decimal numbers separated by 0x3B and ended by the intermediate
    // byte 0x20 (ARIB STD-B24 Volume 1 Part 2, 7.2.5).
    memset(mCSIParam, 0, sizeof(mCSIParam));
    size_t param = 0;
    size_t digits = 0;
    for (size_t i = 0; i + 1 < mCSIBuffer.size(); ++i) {
        const uint8_t b = mCSIBuffer[i];
        if (b == 0x20)
            break;
        if (b == ';') {
            if (++param >= 2)
                break;
            digits = 0;
        } else if (digits < sizeof(mCSIParam[0]) - 1) {
            mCSIParam[param][digits++] = static_cast<char>(b);
        }
    }
    const int p1 = atoi(mCSIParam[0]);
    const int p2 = atoi(mCSIParam[1]);
    CSIAttributes& a = mCSIAttributes;
    bool known = true;
    switch (final) {
        case 0x42:
            a.graphicWidth = p1;
            a.graphicHeight = p2;
            break;  // GSM
        case 0x53:
            a.writingFormat = p1;
            break;  // SWF
        case 0x54:
            a.compositeControl = p1;
            break;  // CCC
        case 0x56:
            a.displayWidth = p1;
            a.displayHeight = p2;
            break;  // SDF
        case 0x57:
            a.charWidth = p1;
            a.charHeight = p2;
            break;  // SSM
        case 0x58:
            a.horizontalSpacing = p1;
            break;  // SHS
        case 0x59:
            a.verticalSpacing = p1;
            break;  // SVS
        case 0x5F:
        case 0x61:
            a.positionX = p1;
            a.positionY = p2;
            break;  // SDP, ACPS
        case 0x6E:
            a.rasterColour = p1;
            break;  // RCS
        case 0x5D:
        case 0x5E:
        case 0x62:
        case 0x63:
        case 0x64:
        case 0x65:  // GAA, SRC, TCC,
        case 0x66:
        case 0x68:
            a.colourControl = p1;
            break;  // ORN..XCS, PRA
        default:
            known = false;
            break;
    }
    if (known)
        a.lastCommand = final;
    else
        TAVO_LOGD("CONTROLCODE not valid\n");
    mCSIBuffer.clear();
    mCSILength = 0;
}

unsigned int ClosedCaptionDecoder::buildCCString() {
    memset(mCSIParam, 0, sizeof(mCSIParam));
    mCCString.clear();
    for (const auto& row : mScreen) {
        if (row[0] == 0)
            continue;
        int column = 0;
        while (column < kColumns && row[column] != 0)
            mCCString.push_back(row[column++]);
        // Intended: a full row gets no line feed.
        if (column < kColumns)
            mCCString.push_back(10);
    }
    return static_cast<unsigned int>(mCCString.size() * sizeof(uint32_t));
}

void ClosedCaptionDecoder::clearScreenData() {
    memset(mScreen, 0, sizeof(mScreen));
    mRow = -1;
    mColumn = -1;
}

unsigned int ClosedCaptionDecoder::getCCSize() const {
    return static_cast<unsigned int>(mCCString.size() * sizeof(uint32_t));
}

void ClosedCaptionDecoder::getCC(unsigned char* buffer, unsigned int size) const {
    const unsigned int length = getCCSize();
    if (buffer == nullptr || length > size)
        return;
    memcpy(buffer, mCCString.data(), length);
}

}  // namespace TavoPlayer

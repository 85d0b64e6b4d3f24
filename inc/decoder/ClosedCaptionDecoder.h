// ClosedCaptionDecoder: the caption chain's decoder module. It reads PESData
// records of the caption PID, runs the statement body of each caption PES (ARIB
// STD-B24 Volume 1 Part 3, chapter 9; ABNT NBR 15606-1, Latin character set)
// through a byte state machine that keeps a three-row screen of 32 columns, and
// writes the visible text as one ClosedCaptionFragmentData record per PES, stamped
// with the PES's PTS.
//
// Threads: the controller calls start, stop and dump; the worker "CCWorkerThread"
// runs every other operation and is the only writer of the decoder's state.
// getCC and getCCSize read the caption text without a lock, for diagnostics only.
#pragma once

#include <cstdint>
#include <cstdio>
#include <vector>

#include <utils/StrongPointer.h>
#include <utils/Thread.h>

#include "common/Module.h"
#include "common/data/PESData.h"
#include "platform/os/ThreadName.h"

namespace TavoPlayer {

class ClosedCaptionDecoder : public Module {
public:
    // Results of processPacket.
    enum : unsigned int {
        RESULT_NOTHING = 0,   // malformed, nothing to show, or no room in the output
        RESULT_WRITTEN = 1,   // one caption record written
        RESULT_EMPTY = 2,     // the unit put nothing on the screen
        RESULT_NOT_BODY = 4,  // the data unit is not a statement body
    };

    static constexpr int kRows = 3;
    static constexpr int kColumns = 32;

    ClosedCaptionDecoder();
    ~ClosedCaptionDecoder() override;

    unsigned int start() override;
    unsigned int stop() override;
    unsigned int dump(FILE* stream, int indent) override;

    unsigned int processPacket(PESData* record);
    void processCCByte(unsigned char byte);
    void findCommand(unsigned char byte);
    void handleCommands(uint8_t byte);
    void identifyCSICommand();
    // Rebuilds the caption text from the screen; returns its length in bytes.
    unsigned int buildCCString();
    void clearScreenData();
    unsigned int getCCSize() const;
    // Copies the caption text when it fits in `size` bytes; otherwise nothing.
    void getCC(unsigned char* buffer, unsigned int size) const;

    // One round of the worker: at most one record.
    void WorkerThreadRunner();

private:
    class WorkerThread : public android::Thread {
    public:
        // The decoder owns this thread and outlives it (stop() joins it).
        explicit WorkerThread(ClosedCaptionDecoder* decoder)
            : android::Thread(false), mDecoder(decoder) {}

    private:
        android::status_t readyToRun() override {
            setCurrentThreadName("CCWorkerThread");
            return android::OK;
        }
        bool threadLoop() override {
            mDecoder->WorkerThreadRunner();
            return true;
        }
        ClosedCaptionDecoder* mDecoder;
    };

    // Values taken from CSI sequences (ARIB STD-B24 Volume 1 Part 3, 7.2.5). None of
    // them changes the caption text; they are kept for dump().
    struct CSIAttributes {
        int writingFormat;  // SWF
        int displayWidth;   // SDF
        int displayHeight;
        int positionX;  // SDP
        int positionY;
        int charWidth;  // SSM
        int charHeight;
        int horizontalSpacing;  // SHS
        int verticalSpacing;    // SVS
        int compositeControl;   // CCC
        int graphicWidth;       // GSM
        int graphicHeight;
        int rasterColour;   // RCS
        int colourControl;  // ORN, MDF, CFS, XCS, PRA, ACPS, TCC, SRC, GAA
        int lastCommand;    // final byte of the last recognised sequence
    };

    void scrollUp();
    void resetState();

    int32_t mParameterCount;
    bool mCSI;
    int32_t mCSILength;
    bool mPAPF, mAPS, mSZX, mCOL, mFLC, mCDC, mPOL, mWMM, mMACRO, mHLC, mRPC, mTIME;
    int32_t mColumn;
    int32_t mRow;
    bool mNewLine;
    char mCSIParam[2][10];
    std::vector<uint8_t> mCSIBuffer;
    std::vector<uint32_t> mCCString;
    uint32_t mScreen[kRows][kColumns + 1];
    uint8_t mBEL, mCAN, mESC, mLS0, mLS1, mSS2;
    bool mSS3;
    uint8_t mBKF, mRDF, mGRF, mYLF, mBLF, mMGF, mCNF, mWHF, mSSZ, mMSZ, mNSZ, mSTL, mSPL;
    uint8_t mCOLParam, mPOLParam, mFLCParam, mWMMParam, mMACROParam, mRPCParam, mHLCParam,
        mSZXParam;
    uint8_t mCDCParam[2];
    uint8_t mTIMEParam[2];
    uint8_t mAPSRow, mAPSColumn;
    // Which parameter of the two-byte codes comes next (the design's flag per code
    // says only that a code is pending).
    bool mAPSRowSeen, mCDCFirstSeen, mTIMEFirstSeen;
    CSIAttributes mCSIAttributes;
    android::sp<WorkerThread> mWorkerThread;
};

}  // namespace TavoPlayer

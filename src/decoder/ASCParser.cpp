#include "decoder/ASCParser.h"

namespace TavoPlayer {

void ASCParser::writeAOT(WriteBitInterface* writer, unsigned char audioObjectType) {
    if (audioObjectType < 32) {
        writer->writeBits(audioObjectType, 5);
    } else {
        writer->writeBits(31, 5);
        writer->writeBits(audioObjectType - 32u, 6);
    }
}

void ASCParser::writeSamplingFrequency(WriteBitInterface* writer, uint32_t index,
                                       uint32_t frequency) {
    writer->writeBits(index, 4);
    if (index == 15) {
        writer->writeBits(frequency >> 16, 8);
        writer->writeBits(frequency & 0xFFFFu, 16);
    }
}

unsigned int ASCParser::createASC(unsigned char** asc, unsigned int* size) {
    if (asc == nullptr) {
        return 1;
    }
    auto* buffer = new unsigned char[kAscSizeBytes]();
    auto* writer = new WriteBitInterface(buffer, kAscSizeBytes);
    const bool explicitSbr = mExtensionAudioObjectType == kAotSbr;
    // With explicit SBR the extension type comes first and the core type last
    // (hierarchical signalling, ISO/IEC 14496-3, 1.6.5.1).
    if (explicitSbr) {
        writer->writeBits(kAotSbr, 5);
    } else {
        writeAOT(writer, static_cast<unsigned char>(mAudioObjectType));
    }
    writeSamplingFrequency(writer, mSamplingFrequencyIndex, mSamplingFrequency);
    writer->writeBits(mChannelConfiguration, 4);
    if (explicitSbr) {
        writeSamplingFrequency(writer, mExtensionSamplingFrequencyIndex,
                               mExtensionSamplingFrequency);
        writeAOT(writer, static_cast<unsigned char>(mAudioObjectType));
    }
    delete writer;
    *asc = buffer;
    if (size != nullptr) {
        *size = kAscSizeBytes;  // deliberately the whole buffer, whatever was written
    }
    return 0;
}

}  // namespace TavoPlayer

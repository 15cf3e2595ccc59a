// zanFrameBufferToTIFF: a whole frame as one page in one call.

#include <gtest/gtest.h>

#include <cstring>

#include <tiffio.h>

#include "write_support.h"

namespace {

using namespace zantest;

// A frame job: the frame buffer is the test's, described in the context.
class FrameJob : public WriteJob {
public:
    FrameJob(uint32_t colorSpace, uint32_t width, uint32_t height, uint64_t rowBytes, Dest dest = Dest::Memory)
        : WriteJob(dest), frame_(static_cast<size_t>(rowBytes * height)) {
        for (size_t i = 0; i < frame_.size(); ++i) frame_[i] = static_cast<uint8_t>(i * 31 + i / 7);
        (*this)->colorSpace = colorSpace;
        (*this)->frameWidth = width;
        (*this)->frameHeight = height;
        (*this)->frameData = frame_.data();
        (*this)->frameBufferSize = static_cast<uint32_t>(frame_.size());
        (*this)->bitsPerSample = 8;
        (*this)->outputBitsPerSample = 8;
    }
    ~FrameJob() { (*this)->frameData = nullptr; }  // the frame is the test's, not the job's
    int Write() { return zanFrameBufferToTIFF(host().ctx()); }
    Bytes Finish() {
        (*this)->frameData = nullptr;
        return WriteJob::Finish();
    }
    Bytes& frame() { return frame_; }

private:
    Bytes frame_;
};

TEST(FrameWriter, RgbFrameIsOnePackBitsPageInStrips) {
    FrameJob job(8, 400, 21, 1200);  // libtiff's default strips of 8 KiB: 6 rows, the last strip shorter
    job->outputCompression = ZAN_COMPRESSION_LZW;  // not consulted
    const Bytes frame = job.frame();
    ASSERT_EQ(job.Write(), 1);
    EXPECT_EQ(job->tiff, nullptr) << "the call closes what it opened";
    EXPECT_EQ(job->memBase, nullptr) << "the memory result is handed over";
    const Bytes tiff = job.Finish();
    EXPECT_EQ(job.size(), tiff.size());
    PageReader page(tiff);
    EXPECT_EQ(page.U16(TIFFTAG_COMPRESSION), static_cast<uint32_t>(COMPRESSION_PACKBITS));
    EXPECT_EQ(page.U16(TIFFTAG_PHOTOMETRIC), 2u);
    EXPECT_EQ(page.U16(TIFFTAG_SAMPLESPERPIXEL), 3u);
    uint16_t count = 0, *kinds = nullptr;
    EXPECT_FALSE(TIFFGetField(page.get(), TIFFTAG_EXTRASAMPLES, &count, &kinds) && count);
    EXPECT_EQ(page.U32(TIFFTAG_SUBFILETYPE), 0u);
    const uint32_t rows = page.U32(TIFFTAG_ROWSPERSTRIP);
    ASSERT_GT(rows, 0u);
    EXPECT_NE(21 % rows, 0u);
    EXPECT_EQ(TIFFNumberOfStrips(page.get()), (21 + rows - 1) / rows);
    EXPECT_EQ(DumpPage(tiff, 0).data, frame);
}

TEST(FrameWriter, BilevelFrameIsGroup4) {
    for (uint32_t t6 : {0u, 1u}) {
        FrameJob job(1, 100, 50, 13);
        job->frameWhiteIsZero = 1;
        job->t6OptionsSet = t6;
        for (size_t i = 12; i < job.frame().size(); i += 13) job.frame()[i] &= 0xF0;  // 100 of 104 bits
        const Bytes frame = job.frame();
        ASSERT_EQ(job.Write(), 1);
        const Bytes tiff = job.Finish();
        PageReader page(tiff);
        EXPECT_EQ(page.U16(TIFFTAG_COMPRESSION), static_cast<uint32_t>(COMPRESSION_CCITTFAX4));
        EXPECT_EQ(page.U16(TIFFTAG_PHOTOMETRIC), 0u);
        EXPECT_EQ(page.U32(TIFFTAG_GROUP4OPTIONS) != 0xFFFFFFFFu, t6 != 0);
        EXPECT_EQ(DumpPage(tiff, 0).data, frame);
    }
}

TEST(FrameWriter, SixteenBitFramesAreKeptOrReduced) {
    for (uint32_t outputBits : {8u, 16u}) {
        FrameJob job(2, 4, 2, 8);
        job->bitsPerSample = 16;
        job->outputBitsPerSample = outputBits;
        const Bytes frame = job.frame();
        ASSERT_EQ(job.Write(), 1);
        if (outputBits == 8) {
            EXPECT_EQ(job.frame()[0], frame[1]) << "the frame begins with the high bytes";
            EXPECT_EQ(job.frame()[7], frame[15]);
        }
        PageReader page(job.Finish());
        EXPECT_EQ(page.U16(TIFFTAG_BITSPERSAMPLE), outputBits);
    }
}

TEST(FrameWriter, RefusalsAndTheirMessages) {
    struct Case {
        uint32_t colorSpace, bits, outputBits;
        const char* message;
    } cases[] = {
        {5, 8, 8, "Incompatible frame type"},
        {4, 8, 8, "Incompatible frame type"},
        {2, 8, 16, "Compressing from 8 to 16 bits image is not supported."},
        {1, 1, 16, "Compressing from 1 to 16 bits image is not supported."},
    };
    for (const Case& c : cases) {
        FrameJob job(c.colorSpace, 4, 4, 16);
        job->bitsPerSample = c.bits;
        job->outputBitsPerSample = c.outputBits;
        EXPECT_EQ(job.Write(), 0);
        EXPECT_EQ(job.host().Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(job->tiff, nullptr) << "nothing is opened";
    }
    // A frame smaller than it says, and one whose size does not fit in 64
    // bits (and wrapped to a small one before).
    FrameJob small(8, 10, 10, 30);
    small->frameBufferSize = 200;
    FrameJob absurd(7, 4, 4, 16);  // 2^31 x 2^31 RGBA pixels of 16 bits: 2^65 bytes
    absurd->frameWidth = absurd->frameHeight = 0x80000000u;
    absurd->bitsPerSample = 16;
    absurd->frameBufferSize = 0;
    for (FrameJob* job : {&small, &absurd}) {
        EXPECT_EQ(job->Write(), 0);
        EXPECT_EQ(job->host().Errors(), std::vector<std::string>{"Frame buffer too small for the frame described."});
    }
}

TEST(FrameWriter, FailedShrinkHandsOverTheWholeBlock) {
    FrameJob job(2, 64, 64, 64);
    // The last allocating call of the job is the shrink of the result.
    int calls = 0;
    {
        FrameJob probe(2, 64, 64, 64);
        TestAllocator::Reset();
        ASSERT_EQ(probe.Write(), 1);
        calls = TestAllocator::Calls();
    }
    TestAllocator::Reset();
    TestAllocator::FailNthCall(calls);
    ASSERT_EQ(job.Write(), 1);
    TestAllocator::Reset();
    const Bytes tiff = job.Finish();
    EXPECT_EQ(tiff.size(), job.size());
    EXPECT_EQ(DumpPage(tiff, 0).data, job.frame());
}

TEST(FrameWriter, FixedBufferThatIsTooSmallFailsCleanly) {
    FrameJob job(8, 64, 64, 192, Dest::FixedBuffer);
    job->destMemoryCapacity = 1000;
    EXPECT_EQ(job.Write(), 0);
    EXPECT_EQ(job->tiff, nullptr);
    EXPECT_FALSE(job.host().codecErrors.empty() && job.host().Errors().empty());
    job.Finish();
    EXPECT_LE(job.size(), 1000u) << "nothing written beyond the capacity";
}

TEST(FrameWriter, EveryAllocationCanFailCleanly) {
    for (int n = 1;; ++n) {
        int calls = 0;
        {
            FrameJob job(7, 50, 40, 200);
            TestAllocator::Reset();
            TestAllocator::FailNthCall(n);
            const int result = job.Write();
            calls = TestAllocator::Calls();
            if (!result) {
                EXPECT_FALSE(job.host().Errors().empty() && job.host().codecErrors.empty()) << n;
            }
            job.Finish();
        }
        TestAllocator::Reset();
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << n;
        if (calls < n) break;
    }
}

}  // namespace

// zanFrameBufferToTIFF: a whole frame as one page in one call.

#include <gtest/gtest.h>

#include <tiffio.h>

#include "write_support.h"

namespace {

using namespace zantest;

// A frame job: the frame buffer is the test's (not the job's to release),
// described in the context.
struct FrameJob : WriteJob {
    FrameJob(uint32_t colorSpace, uint32_t width, uint32_t height, uint64_t rowBytes, Dest dest = Dest::Memory)
        : WriteJob(dest), frame(static_cast<size_t>(rowBytes * height)) {
        for (size_t i = 0; i < frame.size(); ++i) frame[i] = static_cast<uint8_t>(i * 31 + i / 7);
        (*this)->colorSpace = colorSpace;
        (*this)->frameWidth = width;
        (*this)->frameHeight = height;
        (*this)->frameData = frame.data();
        (*this)->frameBufferSize = static_cast<uint32_t>(frame.size());
        (*this)->bitsPerSample = (*this)->outputBitsPerSample = 8;
        (*this)->outputCompression = ZAN_COMPRESSION_LZW;  // not consulted
    }
    ~FrameJob() { (*this)->frameData = nullptr; }
    int Write() { return zanFrameBufferToTIFF(host().ctx()); }
    Bytes Finish() {
        (*this)->frameData = nullptr;
        return WriteJob::Finish();
    }
    Bytes frame;
};

TEST(FrameWriter, FramesBecomeOnePageOfTheirPixels) {
    // Bi-level frames are Group 4, others PackBits in libtiff's default strips
    // (of 8 KiB: 6 RGB rows of 400); 16-bit frames are kept or reduced in place.
    const struct Case {
        uint32_t colorSpace, width, height, rowBytes, bits, outputBits, t6;
        std::vector<std::string> lines, absent;
    } cases[] = {
        {8, 400, 21, 1200, 8, 8, 0,
         {"Subfile Type: (0 = 0x0)", "Compression Scheme: PackBits", "Photometric Interpretation: RGB color",
          "Samples/Pixel: 3", "Bits/Sample: 8", "Rows/Strip: 6"},
         {"Extra Samples"}},
        {1, 100, 50, 13, 8, 8, 0,
         {"Compression Scheme: CCITT Group 4", "Photometric Interpretation: min-is-white", "Bits/Sample: 1"},
         {"Group 4 Options"}},
        {1, 100, 50, 13, 8, 8, 1, {"Compression Scheme: CCITT Group 4", "Group 4 Options: (0 = 0x0)"}, {}},
        {2, 4, 2, 8, 16, 16, 0, {"Compression Scheme: PackBits", "Bits/Sample: 16"}, {}},
        {2, 4, 2, 8, 16, 8, 0, {"Compression Scheme: PackBits", "Bits/Sample: 8"}, {}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(::testing::Message() << "colour space " << c.colorSpace << ", " << c.outputBits << " bits");
        FrameJob job(c.colorSpace, c.width, c.height, c.rowBytes);
        job->frameWhiteIsZero = 1;
        job->t6OptionsSet = c.t6;
        job->bitsPerSample = c.bits;
        job->outputBitsPerSample = c.outputBits;
        if (c.colorSpace == 1)  // 100 of 104 bits
            for (size_t i = 12; i < job.frame.size(); i += 13) job.frame[i] &= 0xF0;
        const Bytes pixels = c.bits == c.outputBits ? job.frame : HighBytes(job.frame);
        ASSERT_EQ(job.Write(), 1);
        EXPECT_EQ(job->tiff, nullptr) << "the call closes what it opened";
        EXPECT_EQ(job->memBase, nullptr) << "the memory result is handed over";
        EXPECT_EQ(Bytes(job.frame.begin(), job.frame.begin() + pixels.size()), pixels);
        const Bytes tiff = job.Finish();
        EXPECT_EQ(job.size(), tiff.size());
        const PageDump page = DumpPage(tiff, 0);
        ExpectListing(page.tags, c.lines, c.absent);
        EXPECT_EQ(page.data, pixels);
    }
}

TEST(FrameWriter, RefusalsAndTheirMessages) {
    // Refused frames are named to the host and nothing is opened.
    struct Case {
        uint32_t colorSpace, bits, outputBits, width, bufferSize;
        const char* message;
    } cases[] = {
        {5, 8, 8, 4, 16, "Incompatible frame type"},
        {4, 8, 8, 4, 16, "Incompatible frame type"},
        {2, 8, 16, 4, 16, "Compressing from 8 to 16 bits image is not supported."},
        {1, 1, 16, 4, 16, "Compressing from 1 to 16 bits image is not supported."},
        {8, 8, 8, 4, 47, "Frame buffer too small for the frame described."},
        // 2^31 x 2^31 RGBA pixels of 16 bits: 2^65 bytes (wrapped to a small size before).
        {7, 16, 8, 0x80000000u, 0, "Frame buffer too small for the frame described."},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.message);
        FrameJob job(c.colorSpace, 4, 4, 16);
        job->bitsPerSample = c.bits;
        job->outputBitsPerSample = c.outputBits;
        job->frameBufferSize = c.bufferSize;
        job->frameWidth = job->frameHeight = c.width;
        EXPECT_EQ(job.Write(), 0);
        EXPECT_EQ(job.host().Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(job->tiff, nullptr);
    }
}

TEST(FrameWriter, FixedBufferThatIsTooSmallFailsCleanly) {
    // The host is told, and nothing is written beyond the capacity.
    FrameJob job(8, 64, 64, 192, Dest::FixedBuffer);
    job->destMemoryCapacity = 1000;
    EXPECT_EQ(job.Write(), 0);
    EXPECT_EQ(job->tiff, nullptr);
    EXPECT_TRUE(Reported(job.host()));
    job.Finish();
    EXPECT_LE(job.size(), 1000u);
}

TEST(FrameWriter, EveryAllocationCanFailCleanly) {
    // Failures are reported and leak nothing; a call that still succeeds (a
    // failed shrink of the result) gives the whole page.
    SweepAllocations([] { return std::make_unique<FrameJob>(7, 50, 40, 200); },
                     [](FrameJob& job, int n) {
                         const Bytes frame = job.frame;
                         if (!job.Write()) return false;
                         const Bytes tiff = job.Finish();
                         EXPECT_EQ(tiff.size(), job.size()) << n;
                         EXPECT_EQ(DumpPage(tiff, 0).data, frame) << n;
                         return true;
                     });
}

}  // namespace

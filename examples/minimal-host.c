/* minimal-host: the smallest useful host of libzantiff, in plain C99.
 * Describes one page of a TIFF file and writes its rows as a binary PGM
 * (grey pages) or PPM (colour and palette pages), 8 bits a sample.
 * Usage: minimal-host IN.tif PAGE OUT.pnm */
#include <stdio.h>
#include <stdlib.h>

#include <pivlo/pivlo.h>
#include <zantiff/zantiff.h>

/* Errors and warnings to standard error; traces (severity 2) dropped. */
static void print_message(ConversionContext* ctx, int severity, int level, const char* text) {
    (void)ctx;
    (void)level;
    if (severity < 2) fprintf(stderr, "%s: %s\n", severity == 0 ? "error" : "warning", text);
}

int main(int argc, char** argv) {
    if (argc != 4) {
        fprintf(stderr, "usage: %s IN.tif PAGE OUT.pnm\n", argv[0]);
        return 2;
    }
    FILE* in = fopen(argv[1], "rb");
    if (!in) {
        perror(argv[1]);
        return 1;
    }
    ConversionContext ctx;
    pivloInitContext(&ctx);           /* zeroed record, C-heap allocators */
    ctx.hostMessageProc = print_message;
    ctx.sourceKind = ZAN_SOURCE_FILE;
    ctx.sourceFp = in;
    ctx.pageNumber = atoi(argv[2]);
    ctx.outputBitsPerSample = 8;      /* 16-bit pages arrive as 8 bits */
    ctx.dropExtraSamples = 1;         /* no alpha in PNM */
    int status = 1;
    FILE* out = NULL;
    unsigned char* line = NULL;
    unsigned channels = 0;
    unsigned long rowBytes = 0;
    if (!zanTIFFGetInfo(&ctx)) goto done;
    /* Palette pages are delivered as RGB; other pages keep their samples. */
    channels = ctx.imageType == ZAN_IMAGE_PALETTE ? 3 : ctx.samplesPerPixel;
    if (ctx.bitsPerSample < 8 && ctx.imageType != ZAN_IMAGE_PALETTE) channels = 0;
    if (channels != 1 && channels != 3) {
        fprintf(stderr, "minimal-host: only grey, RGB and palette pages of 8 or 16 bits\n");
        goto done;
    }
    rowBytes = (unsigned long)ctx.imageWidth * channels;
    line = malloc(rowBytes * 2 + 16);  /* room for a row read before it is narrowed */
    out = fopen(argv[3], "wb");
    if (!line || !out) goto done;
    fprintf(out, "P%c\n%u %u\n255\n", channels == 1 ? '5' : '6', ctx.imageWidth, ctx.imageHeight);
    for (unsigned y = 0; y < ctx.imageHeight; ++y) {
        const uint32_t got = zanTIFFReadNextScanLine(&ctx, line, (uint32_t)(rowBytes * 2 + 16));
        if (got == 0 || fwrite(line, 1, rowBytes, out) != rowBytes) goto done;
    }
    status = 0;
done:
    if (out && fclose(out) != 0) status = 1;
    free(line);
    zanDestroyTIFF(&ctx);            /* after every job */
    pivloReleaseContext(&ctx);       /* what the job handed to the host */
    fclose(in);
    return status;
}

// Tracing services the engine calls. A driver supplies its own; hosted programs link velk_host.
#pragma once

// Bit of velk_trace_level that lets informational and diagnostic traces print.
#define VELK_TRACE_DIAGNOSTIC 0x10u

// Behind a declaration: the compiler compares the arguments from number `first` on with the format,
// argument number `text`. Nothing on compilers that cannot.
#if defined(__GNUC__)
#define VELK_PRINTF(text, first) __attribute__((format(printf, text, first)))
#else
#define VELK_PRINTF(text, first)
#endif

extern "C" {

// Which traces print, bit by bit; 0 when the program starts. Assertions ask no bit.
extern unsigned velk_trace_level;

// Prints one trace text, which brings its own line feed. Assertions print through it always.
void _VELKTrace(const char* format, ...) VELK_PRINTF(1, 2);

// Prints to the log of one volume; `handle` is whatever that volume keeps in `logHandle`.
void velk_printk(void* handle, const char* format, ...) VELK_PRINTF(2, 3);

// Prints `size` bytes at `bytes` for a person to read.
void VELK_DumpMemory(const void* bytes, unsigned size);
}

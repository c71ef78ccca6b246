#pragma once

// The few internals the model kit (tools/modelkit) calls: the colour
// statistics, the network loader and its input, the model's file names. The
// shared library exports them so the kit, and the vora tool through it, use
// the library's own copy instead of linking a second, static one. They are
// not part of the public interface and carry no compatibility promise.
#if defined(_WIN32)
#define VORA_KIT_API
#else
#define VORA_KIT_API __attribute__((visibility("default")))
#endif

#pragma once

namespace appsync {

/// Has the allocator of this process keep what it will be asked for again, and share it between
/// threads. For a process that syncs: it takes and returns buffers of some hundred KiB for each
/// application (a package's entries, an icon, a compressor's state), and by itself the allocator
/// would get each from the system and give it back. To be called once, before there are threads.
/// Does nothing where the C library has no such settings.
void tuneAllocator() noexcept;

}  // namespace appsync

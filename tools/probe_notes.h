#pragma once
// What `kelvane probe` adds to the framework's view from the file's headers:
// which channels carry frames stored with zlib compression, which the
// plug-in delivers as they are stored.

// Prints one note per such channel (a regular file only: a stream is read once).
void PrintCompressionNotes(const char* file);

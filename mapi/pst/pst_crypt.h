// The two block encodings of a PST file. Both work in place and only on data
// blocks; internal blocks (data trees, subnode trees) and pages are stored
// as they are.
//
// Permute substitutes every byte through a fixed table (the first 256 bytes
// of kCryptTable encode, the last 256 decode). Cyclic runs each byte through
// the three tables with a rotor keyed by the low 32 bits of the block id;
// the same call encodes and decodes.
#ifndef TARNWELL_MAPI_PST_PST_CRYPT_H_
#define TARNWELL_MAPI_PST_PST_CRYPT_H_

#include <cstddef>
#include <cstdint>

#include "mapi/pst/pst_file.h"

namespace tarnwell::mapi::pst {

void EncodePermute(uint8_t* data, size_t size);
void DecodePermute(uint8_t* data, size_t size);
void CryptCyclic(uint8_t* data, size_t size, uint32_t key);

// The encoding a data block with id `bid` gets in a file using `method`.
void EncodeBlockData(CryptMethod method, uint64_t bid, uint8_t* data, size_t size);
void DecodeBlockData(CryptMethod method, uint64_t bid, uint8_t* data, size_t size);

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_PST_CRYPT_H_

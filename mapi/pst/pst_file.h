// PstFile: the node database (NDB) layer of a Unicode PST file: header,
// allocation maps, node and block B-trees, data blocks (plain, XBLOCK,
// XXBLOCK), subnode trees (SLBLOCK, SIBLOCK) and the block encryption.
//
// The layers above see nodes only: read a node's content, write a node's
// whole content (replacing any earlier one), delete a node, hand out fresh
// node ids. Nothing is visible to other readers of the file before Commit.
//
// Writing never touches a byte a committed reader may need: new blocks and
// pages go after the committed end of the file (allocation maps are added
// where the format places them), the B-trees are written anew, and the
// header goes last. A writer stopped at any point leaves the file as its
// last commit left it. Blocks and pages that a commit no longer references
// stay allocated (they are not reused within the file).
#ifndef TARNWELL_MAPI_PST_PST_FILE_H_
#define TARNWELL_MAPI_PST_PST_FILE_H_

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "base/status.h"
#include "mapi/pst/node.h"

namespace tarnwell::mapi::pst {

enum class CryptMethod : uint8_t { kNone = 0, kPermute = 1, kCyclic = 2 };

// A node as the node B-tree lists it.
struct NodeEntry {
  Nid nid = 0;
  Nid parent = 0;
};

class PstFile {
 public:
  virtual ~PstFile() = default;

  // A new, empty PST (no nodes) at `path`, which must not exist yet.
  static Status Create(const std::string& path, CryptMethod crypt,
                       std::unique_ptr<PstFile>* out);
  // An existing Unicode PST. `writable` opens it for appending.
  static Status Open(const std::string& path, bool writable, std::unique_ptr<PstFile>* out);

  virtual bool writable() const = 0;
  virtual CryptMethod crypt_method() const = 0;

  // Nodes.
  virtual bool HasNode(Nid nid) const = 0;
  virtual std::vector<NodeEntry> ListNodes() const = 0;  // in nid order
  virtual Status ReadNode(Nid nid, NodeContent* out) const = 0;
  // A node id of `type` never used in this file before.
  virtual Nid AllocateNid(uint8_t type) = 0;
  virtual Status WriteNode(Nid nid, Nid parent, const NodeContent& content) = 0;
  virtual Status DeleteNode(Nid nid) = 0;

  // Makes everything written so far part of the file.
  virtual Status Commit() = 0;

  // Bytes the file occupies (committed or not).
  virtual uint64_t file_size() const = 0;
};

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_PST_FILE_H_

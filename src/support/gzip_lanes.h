// Many bytes into one gzip stream by two threads: the caller's and one of its own.
#pragma once

#include <string>
#include <utility>

#include "base/mutex.h"
#include "support/gzip.h"

namespace veltrad {

// Job: cuts what the source gives into blocks, which the threads compress apart, each with the end of the
// block before it as its dictionary, and puts them one behind the other (RFC 1951, 3.2: a block that is
// flushed ends at a byte). Source and output outlive it; the source is called by either thread.
class GzipLanes {
 public:
  GzipLanes(const ByteSource& source, std::string& output) : _source(source), _output(output) {}

  // Once. False: it failed, and a line has said why. `taken`: how many bytes there were.
  bool run(std::size_t& taken);

 private:
  struct Block {
    std::size_t number = 0;
    bool last = false;
    std::string dictionary;
    std::string bytes;
  };

  void runLane();
  bool compressBlocks();
  bool next(Block& block);
  bool takeReading();
  bool read(std::string& bytes);
  void put(const Block& block, const std::string& compressed, unsigned long crc);
  void fail();

  // Constant after construction.
  const ByteSource& _source;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  std::string& _output GUARDED_BY(_mutex);
  std::string _tail GUARDED_BY(_mutex);         // of the last block that was read
  std::size_t _read GUARDED_BY(_mutex) = 0;     // blocks
  std::size_t _written GUARDED_BY(_mutex) = 0;  // blocks
  std::size_t _bytes GUARDED_BY(_mutex) = 0;
  unsigned long _crc GUARDED_BY(_mutex) = 0;
  bool _reading GUARDED_BY(_mutex) = false;  // one of the two is at the source
  bool _ended GUARDED_BY(_mutex) = false;
  bool _failed GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad

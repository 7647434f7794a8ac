#include "platform/foundation/ArchiveLayout.h"

#include <algorithm>
#include <string>

#include "platform/foundation/PropertyListFailure.h"

namespace kx::archive {
namespace {

enum State : std::uint8_t { kWhite, kGrey, kBlack };

struct Node {
  State state = kWhite;
  std::uint8_t height = 0;
};

struct Frame {
  std::uint32_t object;
  std::size_t next;
};

std::string objectPath(std::size_t object) { return "objects[" + std::to_string(object) + "]"; }

[[noreturn]] void failDepth(std::uint32_t object) {
  throw PropertyListFailure(
      PropertyListError::kDepth,
      "more than " + std::to_string(limits::kNestingDepth) + " objects inside one another",
      PropertyListFailure::kNoOffset, objectPath(object));
}

}  // namespace

void checkGraph(const Graph& graph, std::uint32_t root) {
  std::vector<Node> nodes(graph.size());
  std::vector<Frame> stack;
  const auto enter = [&](std::uint32_t object) {
    if (stack.size() >= limits::kNestingDepth) failDepth(object);
    nodes[object].state = kGrey;
    stack.push_back({object, graph.starts[object]});
  };
  std::size_t reached = 0;
  for (enter(root); !stack.empty();) {
    Frame& frame = stack.back();
    if (frame.next == graph.starts[frame.object + 1]) {
      Node& node = nodes[frame.object];
      node.state = kBlack;
      ++node.height;
      const std::uint8_t height = node.height;
      ++reached;
      stack.pop_back();
      if (stack.empty()) break;
      Node& parent = nodes[stack.back().object];
      parent.height = std::max(parent.height, height);
      continue;
    }
    const std::uint32_t target = graph.edges[frame.next++];
    const Node& node = nodes[target];
    if (node.state == kWhite) {
      enter(target);
    } else if (node.state == kGrey) {
      throw PropertyListFailure(PropertyListError::kArchiveCycle, "an object refers to itself",
                                PropertyListFailure::kNoOffset, objectPath(target));
    } else {
      if (stack.size() + node.height > limits::kNestingDepth) failDepth(target);
      Node& parent = nodes[frame.object];
      parent.height = std::max(parent.height, node.height);
    }
  }
  if (reached == graph.size()) return;
  const auto lost = std::find_if(nodes.begin(), nodes.end(),
                                 [](const Node& node) { return node.state == kWhite; });
  throw PropertyListFailure(PropertyListError::kArchiveShape, "an object that nothing refers to",
                            PropertyListFailure::kNoOffset,
                            objectPath(static_cast<std::size_t>(lost - nodes.begin())));
}

}  // namespace kx::archive

#include "pipeline/piece_binding.h"

#include <limits>
#include <utility>

namespace TessikSDK::Pipeline {
namespace {

namespace gb = TessikSDK::GeomBind;

class PieceBinder {
 public:
  PieceBinder(const Mesh& mesh,
              const std::vector<std::uint32_t>& pieceOf,
              std::size_t pieces,
              const GroupBinder& bindGroup,
              gb::IProgress& progress)
      : mesh_(mesh),
        bindGroup_(bindGroup),
        progress_(progress),
        vertices_(pieces),
        triangles_(pieces),
        perVertex_(mesh.positions.size()),
        bound_(mesh.positions.size(), false),
        local_(mesh.positions.size()) {
    for (std::uint32_t v = 0; v < mesh.positions.size(); ++v) vertices_[pieceOf[v]].push_back(v);
    for (const auto& t : mesh.triangles) triangles_[pieceOf[t[0]]].push_back(t);
  }

  PieceBinding run() {
    std::vector<std::uint32_t> all;
    for (std::uint32_t p = 0; p < vertices_.size(); ++p)
      if (!triangles_[p].empty()) all.push_back(p);
    result_.unboundPieces = vertices_.size() - all.size();
    result_.pieceBound.assign(vertices_.size(), false);
    progress_.begin("Binding the pieces in groups", static_cast<int>(all.size()), 0);
    if (all.size() > 1) {
      split(all, 0, all.size());
    } else {
      result_.unboundPieces += all.size();
    }
    progress_.end();
    if (progress_.isCanceled() || result_.unboundPieces == vertices_.size()) return std::move(result_);
    fillUnbound();
    for (const auto& influences : perVertex_) {
      result_.weights.influences.insert(result_.weights.influences.end(), influences.begin(),
                                        influences.end());
      result_.weights.offsets.push_back(static_cast<std::uint32_t>(result_.weights.influences.size()));
    }
    return std::move(result_);
  }

 private:
  // The whole range is known to fail: try each half.
  void split(const std::vector<std::uint32_t>& pieces, std::size_t first, std::size_t last) {
    const std::size_t middle = first + (last - first) / 2;
    attempt(pieces, first, middle);
    attempt(pieces, middle, last);
  }

  void attempt(const std::vector<std::uint32_t>& pieces, std::size_t first, std::size_t last) {
    if (progress_.isCanceled() || first == last) return;
    if (bind(pieces, first, last)) {
      done_ += last - first;
    } else if (last - first == 1) {
      ++result_.unboundPieces;
      ++done_;
    } else {
      split(pieces, first, last);
      return;
    }
    progress_.update(static_cast<int>(done_));
  }

  bool bind(const std::vector<std::uint32_t>& pieces, std::size_t first, std::size_t last) {
    Mesh group;
    for (std::size_t i = first; i < last; ++i) {
      for (std::uint32_t v : vertices_[pieces[i]]) {
        local_[v] = static_cast<std::uint32_t>(group.positions.size());
        group.positions.push_back(mesh_.positions[v]);
      }
      for (const auto& t : triangles_[pieces[i]])
        group.triangles.push_back({local_[t[0]], local_[t[1]], local_[t[2]]});
    }
    const Weights w = bindGroup_(group);
    if (w.numVertices() == 0) return false;
    for (std::size_t i = first; i < last; ++i) result_.pieceBound[pieces[i]] = true;
    for (std::size_t i = first; i < last; ++i)
      for (std::uint32_t v : vertices_[pieces[i]]) {
        perVertex_[v].assign(w.influences.begin() + w.begin(local_[v]),
                             w.influences.begin() + w.end(local_[v]));
        bound_[v] = true;
      }
    return true;
  }

  void fillUnbound() {
    std::vector<std::uint32_t> donors;
    for (std::uint32_t v = 0; v < mesh_.positions.size(); ++v)
      if (bound_[v]) donors.push_back(v);
    for (std::uint32_t v = 0; v < mesh_.positions.size(); ++v) {
      if (bound_[v]) continue;
      std::uint32_t best = donors.front();
      float bestDistance = std::numeric_limits<float>::infinity();
      for (std::uint32_t d : donors) {
        const std::array<float, 3>& a = mesh_.positions[d];
        const std::array<float, 3>& b = mesh_.positions[v];
        const float distance =
            (a[0] - b[0]) * (a[0] - b[0]) + (a[1] - b[1]) * (a[1] - b[1]) + (a[2] - b[2]) * (a[2] - b[2]);
        if (distance < bestDistance) {
          bestDistance = distance;
          best = d;
        }
      }
      perVertex_[v] = perVertex_[best];
    }
  }

  const Mesh& mesh_;
  const GroupBinder& bindGroup_;
  gb::IProgress& progress_;
  std::vector<std::vector<std::uint32_t>> vertices_;
  std::vector<std::vector<std::array<std::uint32_t, 3>>> triangles_;
  std::vector<std::vector<Influence>> perVertex_;
  std::vector<bool> bound_;
  std::vector<std::uint32_t> local_;
  std::size_t done_ = 0;
  PieceBinding result_;
};

}  // namespace

PieceBinding bindInGroups(const Mesh& mesh,
                          const std::vector<std::uint32_t>& pieceOf,
                          std::size_t pieces,
                          const GroupBinder& bindGroup,
                          gb::IProgress& progress) {
  return PieceBinder(mesh, pieceOf, pieces, bindGroup, progress).run();
}

}  // namespace TessikSDK::Pipeline

#pragma once

#include "asset_import.h"

namespace tessik::bind {

// The asset bound when no input is given: a closed character-like figure (torso, head, arms with hands
// and two fingers, legs with feet) made of overlapping shells, and its 30-bone skeleton (pelvis, spine,
// neck, head; l_/r_ clavicle, shoulder, elbow, wrist, fingers, hip, knee, ankle, toe). Y is up and the
// figure faces +Z, its left arm toward +X.
ImportedAsset defaultCharacter();

}  // namespace tessik::bind

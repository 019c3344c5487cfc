// A math model object over any model record of the generic dispatch, for
// the families the model object LumoMathModel does not wrap (aerial photo,
// rational functions) and for hosts that keep their records themselves.
#pragma once

#include <memory>

#include "lumo_types.h"
#include "nova/crs.h"
#include "nova/mathmodel_core.h"

namespace nova {
namespace mathmodel {

// A new object (the caller owns it) whose point operations go through
// GenGeo2Img and GenImg2Geo with nModelCode and the shared record, and whose
// array and block operations are the host's. Ground coordinates are in the
// projection sProjection, heights in the vertical datum eVertical
// (CS_VD_Orthometric or CS_VD_Ellipsoidal); the image is nPixels x nLines.
// Clones share the record, which is never modified. Throws
// nova::ParameterException for a null record, a code outside 1..7, a
// projection without a CRS or a size below 0.
LUMO_API IMathModel* CreateRecordMathModel(int nModelCode, std::shared_ptr<void> poRecord,
                                           const ProjInfo_t& sProjection,
                                           ogc::cs::DatumType eVertical, int nPixels, int nLines);

}  // namespace mathmodel
}  // namespace nova

// Every property-value kind in one include.
#pragma once

#include "platform/CFArray.h"
#include "platform/CFBase.h"
#include "platform/CFCharacterSet.h"
#include "platform/CFData.h"
#include "platform/CFDate.h"
#include "platform/CFDictionary.h"
#include "platform/CFError.h"
#include "platform/CFNumber.h"
#include "platform/CFSet.h"
#include "platform/CFString.h"
#include "platform/CFURL.h"
#include "platform/CFUUID.h"
#include "platform/Log.h"

#pragma once

/// @file
/// The companion facilities under their short names in namespace KivVcs.

#include "KivPlatform/String.h"
#include "KivUtils/Buffer.h"
#include "KivUtils/Callable.h"
#include "KivUtils/Encoding.h"
#include "KivUtils/Stream.h"
#include "KivUtils/Time.h"
#include "KivUtils/Utf8.h"
#include "KivUtils/cow_ptr.h"

namespace KivVcs {

using KivPlatform::CompareCase;
using KivPlatform::KivStringT;
using KivPlatform::KivStringViewT;

using KivUtils::always_return_t;
using KivUtils::array_view;
using KivUtils::cow_ptr;
using KivUtils::emplace;
using KivUtils::emplace_t;
using KivUtils::FromUtf8;
using KivUtils::IStream;
using KivUtils::MemStream;
using KivUtils::optional;
using KivUtils::Stream;
using KivUtils::Time;
using KivUtils::TimeDelta;
using KivUtils::TimeZone;
using KivUtils::ToUtf8;
using KivUtils::Memory::Buffer;
using KivUtils::PortableVersion::Delegate;
using KivUtils::Serialization::StreamIO;

namespace DataEncoding = KivUtils::DataEncoding;
namespace DateTime = KivUtils::DateTime;
namespace helpers = KivUtils::helpers;
namespace immu = KivUtils::immu;
namespace Memory = KivUtils::Memory;
namespace PortableVersion = KivUtils::PortableVersion;
namespace Serialization = KivUtils::Serialization;
namespace String = KivUtils::String;

} // namespace KivVcs

#pragma once
// The ko framework's public interface.

#include "ko/anyvalue.hpp"
#include "ko/dynamicobject.hpp"
#include "ko/error.hpp"
#include "ko/eventloop.hpp"
#include "ko/future.hpp"
#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "ko/metaobject.hpp"
#include "ko/os.hpp"
#include "ko/path.hpp"
#include "ko/periodictask.hpp"
#include "ko/session.hpp"
#include "ko/signal.hpp"

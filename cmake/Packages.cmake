# SPDX-License-Identifier: Apache-2.0
# The Debian packages, one per install component (make package).
set(CPACK_GENERATOR DEB)
set(CPACK_COMPONENTS_ALL Library Runtime Development data)
set(CPACK_PACKAGE_VENDOR "${PROJECT_NAME}")
set(CPACK_PACKAGE_CONTACT "The ${PROJECT_NAME} developers <veldfirewall@localhost>")
set(CPACK_PACKAGE_VERSION ${PROJECT_VERSION})
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "")  # each package has its own; CPack would put a common one in front
set(CPACK_STRIP_FILES ON)
set(CPACK_SET_DESTDIR ON)  # some places are absolute; they must be staged too
set(CPACK_RESOURCE_FILE_LICENSE ${PROJECT_SOURCE_DIR}/LICENSE)

set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_ENABLE_COMPONENT_DEPENDS OFF)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY >=)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
# Where dpkg-shlibdeps finds the libraries of the other packages before they are installed.
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS ${PROJECT_BINARY_DIR}/platform/linux ${PROJECT_BINARY_DIR}/src)

# veld_package(<component> <package> <section> <summary> <depends>)
macro(veld_package component package section summary depends)
  string(TOUPPER ${component} upper)
  set(CPACK_DEBIAN_${upper}_PACKAGE_NAME ${package})
  set(CPACK_DEBIAN_${upper}_PACKAGE_SECTION ${section})
  set(CPACK_DEBIAN_${upper}_DESCRIPTION "${summary}")
  set(CPACK_DEBIAN_${upper}_PACKAGE_DEPENDS "${depends}")
endmacro()

set(same_version "(= ${PROJECT_VERSION})")
veld_package(Library libveldfirewall1 libs "${PROJECT_DESCRIPTION}"
  "libveldplatform1 (>= ${PROJECT_VERSION}), veldfirewall-common (>= ${PROJECT_VERSION}), iptables")
veld_package(Runtime libveldplatform1 libs "Stand-ins for the storage appliance's system libraries"
  "libkmod2")  # opened while running, so dpkg-shlibdeps does not see it
veld_package(Development libveldfirewall-dev libdevel "${PROJECT_DESCRIPTION} (development files)"
  "libveldfirewall1 ${same_version}, libveldplatform1 ${same_version}, libjsoncpp-dev, pkg-config")
veld_package(data veldfirewall-common admin "Profile, service definitions and module list of the firewall" "")
set(CPACK_DEBIAN_DATA_PACKAGE_ARCHITECTURE all)
if(TARGET veldfwctl)
  list(APPEND CPACK_COMPONENTS_ALL tool)
  veld_package(tool veldfwctl admin "Administrator's tool of the firewall" "libveldfirewall1 ${same_version}")
  set(CPACK_DEBIAN_TOOL_PACKAGE_CONTROL_EXTRA ${PROJECT_SOURCE_DIR}/cmake/packageScripts/postinst
    ${PROJECT_SOURCE_DIR}/cmake/packageScripts/prerm ${PROJECT_SOURCE_DIR}/cmake/packageScripts/postrm)
endif()

include(CPack)

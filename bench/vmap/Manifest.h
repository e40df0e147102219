// A realistic plug-in manifest (Info.vmap) in the XML form, about 3.5 KiB:
// the document the registry reads most.
#pragma once

#include <string_view>

namespace platform::vmap::bench {

inline constexpr std::string_view kManifestXml = R"(<?xml version="1.0" encoding="UTF-8"?>
<vmap version="1.0">
<dict>
	<key>BundleIdentifier</key>
	<string>com.example.photos.filters.vintage</string>
	<key>BundleName</key>
	<string>Vintage Filters</string>
	<key>BundleDisplayName</key>
	<string>Vintage Filters</string>
	<key>BundleExecutable</key>
	<string>VintageFilters</string>
	<key>BundlePackageType</key>
	<string>XPC!</string>
	<key>BundleVersion</key>
	<string>1482.7.3</string>
	<key>BundleShortVersionString</key>
	<string>4.12.1</string>
	<key>BundleDevelopmentRegion</key>
	<string>en</string>
	<key>MinimumSystemVersion</key>
	<string>14.2</string>
	<key>BuildMachineOSBuild</key>
	<string>23C71</string>
	<key>BuildDate</key>
	<date>2026-11-23T03:24:38Z</date>
	<key>SigningDate</key>
	<date>2026-11-23T03:31:02.125Z</date>
	<key>InstanceIdentifier</key>
	<uuid>E621E1F8-C36C-495A-93FC-0C247A3E6E5F</uuid>
	<key>SupportedPlatforms</key>
	<array>
		<string>desktop</string>
		<string>tablet</string>
	</array>
	<key>XOExtension</key>
	<dict>
		<key>ExtensionPointIdentifier</key>
		<string>com.example.photos.editing-filter</string>
		<key>PrincipalClass</key>
		<string>VintageFilterProvider</string>
		<key>ExtensionVersion</key>
		<integer>3</integer>
		<key>Attributes</key>
		<dict>
			<key>SupportedMediaTypes</key>
			<array>
				<string>public.jpeg</string>
				<string>public.png</string>
				<string>public.heic</string>
				<string>public.tiff</string>
				<string>com.example.raw-image</string>
			</array>
			<key>MaximumConcurrentSessions</key>
			<integer>4</integer>
			<key>PreferredTileSize</key>
			<integer>512</integer>
			<key>DefaultStrength</key>
			<real>0.75</real>
			<key>SupportsLivePreview</key>
			<true/>
			<key>RequiresNetwork</key>
			<false/>
			<key>Activation</key>
			<dict>
				<key>MatchingRule</key>
				<string>SUBQUERY(items, $item, ANY $item.types == "public.image").@count &gt;= 1</string>
				<key>MaximumItemCount</key>
				<integer>50</integer>
				<key>MaximumFileSize</key>
				<integer>268435456</integer>
			</dict>
			<key>Presets</key>
			<array>
				<dict>
					<key>Name</key>
					<string>Sepia</string>
					<key>Strength</key>
					<real>0.6</real>
				</dict>
				<dict>
					<key>Name</key>
					<string>Faded Film</string>
					<key>Strength</key>
					<real>0.45</real>
				</dict>
				<dict>
					<key>Name</key>
					<string>Kodachrome</string>
					<key>Strength</key>
					<real>0.9</real>
				</dict>
			</array>
		</dict>
		<key>Entitlements</key>
		<array>
			<string>com.example.security.app-sandbox</string>
			<string>com.example.security.files.user-selected.read-only</string>
			<string>com.example.security.temporary-exception.shared-preference</string>
		</array>
	</dict>
	<key>LocalizedNames</key>
	<dict>
		<key>en</key>
		<string>Vintage Filters</string>
		<key>de</key>
		<string>Vintage-Filter</string>
		<key>fr</key>
		<string>Filtres rétro</string>
		<key>es</key>
		<string>Filtros antiguos</string>
		<key>it</key>
		<string>Filtri vintage</string>
		<key>ja</key>
		<string>ヴィンテージフィルタ</string>
		<key>zh-Hans</key>
		<string>复古滤镜</string>
		<key>ko</key>
		<string>빈티지 필터</string>
		<key>ru</key>
		<string>Винтажные фильтры</string>
	</dict>
	<key>Copyright</key>
	<string>Copyright © 2026 Example Corp. All rights reserved.</string>
	<key>IconDigest</key>
	<data>q83vEjRWeJq83vEjRWeJq83vEjRWeJq83vEjRWeJq80=</data>
	<key>CodeDirectoryHash</key>
	<data>
	3q2+7wAAAAEAAAACAAAAAwAAAAQAAAAFAAAABgAAAAcAAAAIAAAACQAAAAoAAAALAAAADAAA
	AA0AAAAOAAAADwAAABA=
	</data>
</dict>
</vmap>
)";

}  // namespace platform::vmap::bench

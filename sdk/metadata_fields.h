// The metadata field names of a file's document, and the options of the
// content extraction that fills them.
//
// Field names are those of the platform's content-extraction library,
// spelling included ("QORUMDContactKeyworlds", "QORUMDRecodingDate" and
// "QORUStateOrProvince" are the real names). A name with a leading
// underscore has a constant named kUnderscore... . The index schema
// (fileindex/elastic/schema.h) maps them; the platform's ParseFile fills
// them.
#pragma once

namespace vellis::sdk::metadata {

// General.
inline constexpr char kQORUMDAttributeChangeDate[] = "QORUMDAttributeChangeDate";
inline constexpr char kQORUMDAudiences[] = "QORUMDAudiences";
inline constexpr char kQORUMDAuthors[] = "QORUMDAuthors";
inline constexpr char kQORUMDAuthorAddresses[] = "QORUMDAuthorAddresses";
inline constexpr char kQORUMDCity[] = "QORUMDCity";
inline constexpr char kQORUMDComment[] = "QORUMDComment";
inline constexpr char kQORUMDContactKeyworlds[] = "QORUMDContactKeyworlds";
inline constexpr char kQORUMDContentCreationDate[] = "QORUMDContentCreationDate";
inline constexpr char kQORUMDContentModificationDate[] = "QORUMDContentModificationDate";
inline constexpr char kQORUMDContentType[] = "QORUMDContentType";
inline constexpr char kQORUMDContentTypeTree[] = "QORUMDContentTypeTree";
inline constexpr char kQORUMDContributors[] = "QORUMDContributors";
inline constexpr char kQORUMDCopyright[] = "QORUMDCopyright";
inline constexpr char kQORUMDCountry[] = "QORUMDCountry";
inline constexpr char kQORUMDCoverage[] = "QORUMDCoverage";
inline constexpr char kQORUMDCreator[] = "QORUMDCreator";
inline constexpr char kQORUMDDescription[] = "QORUMDDescription";
inline constexpr char kQORUMDDisplayName[] = "QORUMDDisplayName";
inline constexpr char kQORUMDDueDate[] = "QORUMDDueDate";
inline constexpr char kQORUMDDurationSecond[] = "QORUMDDurationSecond";
inline constexpr char kQORUMDEmailAddresses[] = "QORUMDEmailAddresses";
inline constexpr char kQORUMDEncodingApplications[] = "QORUMDEncodingApplications";
inline constexpr char kQORUMDFinderComment[] = "QORUMDFinderComment";
inline constexpr char kQORUMDFonts[] = "QORUMDFonts";
inline constexpr char kQORUMDHeadline[] = "QORUMDHeadline";
inline constexpr char kQORUMDIdentifier[] = "QORUMDIdentifier";
inline constexpr char kQORUMDInstantMessageAddresses[] = "QORUMDInstantMessageAddresses";
inline constexpr char kQORUMDInstructions[] = "QORUMDInstructions";
inline constexpr char kQORUMDKeywords[] = "QORUMDKeywords";
inline constexpr char kQORUMDKind[] = "QORUMDKind";
inline constexpr char kQORUMDLanguages[] = "QORUMDLanguages";
inline constexpr char kQORUMDLastUsedDate[] = "QORUMDLastUsedDate";
inline constexpr char kQORUMDNumberOfPages[] = "QORUMDNumberOfPages";
inline constexpr char kQORUMDNamedLocation[] = "QORUMDNamedLocation";
inline constexpr char kQORUMDOrganizations[] = "QORUMDOrganizations";
inline constexpr char kQORUMDPageHeight[] = "QORUMDPageHeight";
inline constexpr char kQORUMDPageWidth[] = "QORUMDPageWidth";
inline constexpr char kQORUMDParticipants[] = "QORUMDParticipants";
inline constexpr char kQORUMDPhoneNumbers[] = "QORUMDPhoneNumbers";
inline constexpr char kQORUMDProjects[] = "QORUMDProjects";
inline constexpr char kQORUMDPublishers[] = "QORUMDPublishers";
inline constexpr char kQORUMDRecipients[] = "QORUMDRecipients";
inline constexpr char kQORUMDRecipientAddresses[] = "QORUMDRecipientAddresses";
inline constexpr char kQORUMDRights[] = "QORUMDRights";
inline constexpr char kQORUMDSecurityMethod[] = "QORUMDSecurityMethod";
inline constexpr char kQORUMDStarRating[] = "QORUMDStarRating";
inline constexpr char kQORUStateOrProvince[] = "QORUStateOrProvince";
inline constexpr char kQORUMDTextContent[] = "QORUMDTextContent";
inline constexpr char kQORUMDTitle[] = "QORUMDTitle";
inline constexpr char kQORUMDVersion[] = "QORUMDVersion";
inline constexpr char kQORUMDWhereFroms[] = "QORUMDWhereFroms";

// Image.
inline constexpr char kQORUMDAcquisitionMake[] = "QORUMDAcquisitionMake";
inline constexpr char kQORUMDAcquisitionModel[] = "QORUMDAcquisitionModel";
inline constexpr char kQORUMDAlbum[] = "QORUMDAlbum";
inline constexpr char kQORUMDAperture[] = "QORUMDAperture";
inline constexpr char kQORUMDBitsPerSample[] = "QORUMDBitsPerSample";
inline constexpr char kQORUMDColorSpace[] = "QORUMDColorSpace";
inline constexpr char kQORUMDEXIFVersion[] = "QORUMDEXIFVersion";
inline constexpr char kQORUMDExposureMode[] = "QORUMDExposureMode";
inline constexpr char kQORUMDExposureProgram[] = "QORUMDExposureProgram";
inline constexpr char kQORUMDExposureTimeSeconds[] = "QORUMDExposureTimeSeconds";
inline constexpr char kQORUMDExposureTimeString[] = "QORUMDExposureTimeString";
inline constexpr char kQORUMDFNumber[] = "QORUMDFNumber";
inline constexpr char kQORUMDFlashOnOff[] = "QORUMDFlashOnOff";
inline constexpr char kQORUMDFocalLength[] = "QORUMDFocalLength";
inline constexpr char kQORUMDHasAlphaChannel[] = "QORUMDHasAlphaChannel";
inline constexpr char kQORUMDISOSpeed[] = "QORUMDISOSpeed";
inline constexpr char kQORUMDLayerNames[] = "QORUMDLayerNames";
inline constexpr char kQORUMDMaxAperture[] = "QORUMDMaxAperture";
inline constexpr char kQORUMDMeteringMode[] = "QORUMDMeteringMode";
inline constexpr char kQORUMDOrientation[] = "QORUMDOrientation";
inline constexpr char kQORUMDPixelHeight[] = "QORUMDPixelHeight";
inline constexpr char kQORUMDPixelWidth[] = "QORUMDPixelWidth";
inline constexpr char kQORUMDPixelCount[] = "QORUMDPixelCount";
inline constexpr char kQORUMDProfileName[] = "QORUMDProfileName";
inline constexpr char kQORUMDRedEyeOnOff[] = "QORUMDRedEyeOnOff";
inline constexpr char kQORUMDResolutionHeightDPI[] = "QORUMDResolutionHeightDPI";
inline constexpr char kQORUMDResolutionWidthDPI[] = "QORUMDResolutionWidthDPI";
inline constexpr char kQORUMDWhiteBalance[] = "QORUMDWhiteBalance";

// Video.
inline constexpr char kQORUMDAudioBitRate[] = "QORUMDAudioBitRate";
inline constexpr char kQORUMDCodecs[] = "QORUMDCodecs";
inline constexpr char kQORUMDDeliveryType[] = "QORUMDDeliveryType";
inline constexpr char kQORUMDMediaTypes[] = "QORUMDMediaTypes";
inline constexpr char kQORUMDStreamable[] = "QORUMDStreamable";
inline constexpr char kQORUMDTotalBitRate[] = "QORUMDTotalBitRate";
inline constexpr char kQORUMDVideoBitRate[] = "QORUMDVideoBitRate";

// Audio.
inline constexpr char kQORUMDAppleLoopDescriptors[] = "QORUMDAppleLoopDescriptors";
inline constexpr char kQORUMDAppleLoopsKeyFilterType[] = "QORUMDAppleLoopsKeyFilterType";
inline constexpr char kQORUMDAppleLoopsLoopMode[] = "QORUMDAppleLoopsLoopMode";
inline constexpr char kQORUMDAppleLoopsRootKey[] = "QORUMDAppleLoopsRootKey";
inline constexpr char kQORUMDAudioChannelCount[] = "QORUMDAudioChannelCount";
inline constexpr char kQORUMDAudioEncodingApplication[] = "QORUMDAudioEncodingApplication";
inline constexpr char kQORUMDAudioSampleRate[] = "QORUMDAudioSampleRate";
inline constexpr char kQORUMDAudioTrackNumber[] = "QORUMDAudioTrackNumber";
inline constexpr char kQORUMDComposer[] = "QORUMDComposer";
inline constexpr char kQORUMDGeneralMIDISequence[] = "QORUMDGeneralMIDISequence";
inline constexpr char kQORUMDKeySignature[] = "QORUMDKeySignature";
inline constexpr char kQORUMDLyricist[] = "QORUMDLyricist";
inline constexpr char kQORUMDMusicalGenre[] = "QORUMDMusicalGenre";
inline constexpr char kQORUMDMusicalInstrumentCategory[] = "QORUMDMusicalInstrumentCategory";
inline constexpr char kQORUMDMusicalInstrumentName[] = "QORUMDMusicalInstrumentName";
inline constexpr char kQORUMDRecodingDate[] = "QORUMDRecodingDate";
inline constexpr char kQORUMDRecordingYear[] = "QORUMDRecordingYear";
inline constexpr char kQORUMDTempo[] = "QORUMDTempo";
inline constexpr char kQORUMDTimeSignature[] = "QORUMDTimeSignature";

// File system.
inline constexpr char kQORUMDFSContentChangeDate[] = "QORUMDFSContentChangeDate";
inline constexpr char kQORUMDFSCreationDate[] = "QORUMDFSCreationDate";
inline constexpr char kQORUMDFSInvisible[] = "QORUMDFSInvisible";
inline constexpr char kQORUMDFSIsExtensionHidden[] = "QORUMDFSIsExtensionHidden";
inline constexpr char kQORUMDFSLabel[] = "QORUMDFSLabel";
inline constexpr char kQORUMDFSName[] = "QORUMDFSName";
inline constexpr char kQORUMDFSNodeCount[] = "QORUMDFSNodeCount";
inline constexpr char kQORUMDOwnerGroupID[] = "QORUMDOwnerGroupID";
inline constexpr char kQORUMDOwnerUserID[] = "QORUMDOwnerUserID";
inline constexpr char kQORUMDFSSize[] = "QORUMDFSSize";
inline constexpr char kQORUMDPath[] = "QORUMDPath";
inline constexpr char kUnderscoreQORUMDUserTags[] = "_QORUMDUserTags";
inline constexpr char kQORUMDParent[] = "QORUMDParent";
inline constexpr char kQORUMDSearchFileName[] = "QORUMDSearchFileName";
inline constexpr char kQORUMDExtension[] = "QORUMDExtension";
inline constexpr char kQORUMDPrivilege[] = "QORUMDPrivilege";
inline constexpr char kQORUMDIsDir[] = "QORUMDIsDir";
inline constexpr char kQORUMDWildcard[] = "QORUMDWildcard";
inline constexpr char kUnderscoreQORUMDFinderLabel[] = "_QORUMDFinderLabel";
inline constexpr char kUnderscoreQORUMDGroupId[] = "_QORUMDGroupId";
inline constexpr char kQORUMDFinderOpenDate[] = "QORUMDFinderOpenDate";
inline constexpr char kQORUMDLogicalSize[] = "QORUMDLogicalSize";
inline constexpr char kQORUMDPhysicalSize[] = "QORUMDPhysicalSize";
inline constexpr char kQORUMDDateAdded[] = "QORUMDDateAdded";
inline constexpr char kQORUMDPeopleDisplayName[] = "QORUMDPeopleDisplayName";

// Content-extraction options and the extraction service.
inline constexpr char kCENeedMeta[] = "need_meta";  // bool: content metadata as well
inline constexpr char kCECfg[] = "cfg";
inline constexpr char kCEPath[] = "path";
inline constexpr char kCEPseudoPath[] = "pseudo_path";
inline constexpr char kContentExtractDaemonName[] = "qorucontentextractd";
inline constexpr char kContentExtractPidPath[] = "/var/run/qorucontentextractd.pid";
inline constexpr char kContentExtractShmPath[] = "/tmp/qoruce_shm";

}  // namespace vellis::sdk::metadata

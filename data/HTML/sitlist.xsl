<?xml version="1.0" encoding="UTF-8"?>
<!-- Shows the rows of a query-string response as one HTML table: a column
     per element of the first row. -->
<xsl:stylesheet version="1.0" xmlns:xsl="http://www.w3.org/1999/XSL/Transform">
<xsl:output method="html" encoding="UTF-8"/>
<xsl:template match="/">
<html>
<head>
<title>Rows of <xsl:value-of select="//TABLE/@name"/></title>
<link rel="stylesheet" type="text/css" href="/soap/vems.css"/>
</head>
<body>
<h1>Rows of <xsl:value-of select="//TABLE/@name"/></h1>
<xsl:choose>
<xsl:when test="//DATA/ROW">
<table>
<tr><xsl:for-each select="(//DATA/ROW)[1]/*"><th><xsl:value-of select="name()"/></th></xsl:for-each></tr>
<xsl:for-each select="//DATA/ROW">
<tr><xsl:for-each select="*"><td><xsl:value-of select="."/></td></xsl:for-each></tr>
</xsl:for-each>
</table>
</xsl:when>
<xsl:otherwise><p>No rows.</p></xsl:otherwise>
</xsl:choose>
<p><a href="/soap/situations.htm">Back</a></p>
</body>
</html>
</xsl:template>
</xsl:stylesheet>
